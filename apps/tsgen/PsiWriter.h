#pragma once

#include <cstdint>
#include <vector>

#include "Options.h"

namespace TavoPlayer::tsgen {

// Builds the programme tables of the single service tsgen writes, through
// libdvbpsi: the PAT and the PMT with ISDB-Tb stream types and stream
// identifier descriptors (component tags 0x00 video, 0x10 audio, 0x30 captions).
class PsiWriter {
public:
    // Returns 0 with both sections built (CRC included), 1 on a library failure.
    int build(const Options& options);
    const std::vector<uint8_t>& patSection() const { return mPat; }
    const std::vector<uint8_t>& pmtSection() const { return mPmt; }

private:
    std::vector<uint8_t> mPat;
    std::vector<uint8_t> mPmt;
};

}  // namespace TavoPlayer::tsgen
