#pragma once

#include <cstdint>
#include <deque>
#include <vector>

#include "PesUnit.h"
#include "TsMuxer.h"

namespace TavoPlayer::tsgen {

// Cuts the units of a source into PES payloads of a fixed byte count, with no
// regard for access-unit boundaries: a unit may span several PES and a PES may
// hold several units. Each PES takes the times of the first unit that starts in
// it; one in which no unit starts has no PTS (ISO/IEC 13818-1, 2.4.3.7).
class PesResegmenter {
public:
    PesResegmenter(TsMuxer::Source source, size_t pesBytes);

    // Same contract as TsMuxer::Source.
    int next(PesUnit& unit);

private:
    struct Start {
        size_t offset;  // into mBytes
        PesUnit times;  // payload empty
    };

    TsMuxer::Source mSource;
    size_t mPesBytes;
    std::vector<uint8_t> mBytes;
    std::deque<Start> mStarts;
    PesUnit mCurrent;  // times of the unit the next byte belongs to
    bool mEnded = false;
};

}  // namespace TavoPlayer::tsgen
