#include "PsiWriter.h"

#include <dvbpsi/descriptor.h>
#include <dvbpsi/dvbpsi.h>
#include <dvbpsi/pat.h>
#include <dvbpsi/pmt.h>
#include <dvbpsi/psi.h>

#include <memory>

namespace TavoPlayer::tsgen {

namespace {

// Stream types of ISO/IEC 13818-1, Table 2-34, as ABNT NBR 15603 uses them.
constexpr uint8_t kStreamTypeH264 = 0x1B;
constexpr uint8_t kStreamTypePrivatePes = 0x06;
// ISO/IEC 13818-1, 2.6 / ARIB STD-B10: stream_identifier_descriptor.
constexpr uint8_t kTagStreamIdentifier = 0x52;
// ARIB STD-B10: data_component_descriptor; data_component_id 0x0008 declares
// ARIB STD-B24 / ABNT NBR 15606-1 closed captions.
constexpr uint8_t kTagDataComponent = 0xFD;

struct DvbpsiDeleter {
    void operator()(dvbpsi_t* p) const { dvbpsi_delete(p); }
};
struct PatDeleter {
    void operator()(dvbpsi_pat_t* p) const { dvbpsi_pat_delete(p); }
};
struct PmtDeleter {
    void operator()(dvbpsi_pmt_t* p) const { dvbpsi_pmt_delete(p); }
};
struct SectionDeleter {
    void operator()(dvbpsi_psi_section_t* p) const { dvbpsi_DeletePSISections(p); }
};

int copySection(dvbpsi_psi_section_t* section, std::vector<uint8_t>& out) {
    // A single service's tables always fit one section.
    if (section == nullptr || section->p_next != nullptr) {
        return 1;
    }
    const size_t size = static_cast<size_t>(section->p_payload_end - section->p_data) + 4;
    out.assign(section->p_data, section->p_data + size);
    return 0;
}

}  // namespace

int PsiWriter::build(const Options& options) {
    std::unique_ptr<dvbpsi_t, DvbpsiDeleter> handle(dvbpsi_new(nullptr, DVBPSI_MSG_NONE));
    if (!handle) {
        return 1;
    }

    std::unique_ptr<dvbpsi_pat_t, PatDeleter> pat(
        dvbpsi_pat_new(options.transportStreamId, 0, true));
    if (!pat ||
        dvbpsi_pat_program_add(pat.get(), options.programNumber, options.pmtPid) == nullptr) {
        return 1;
    }
    std::unique_ptr<dvbpsi_psi_section_t, SectionDeleter> patSections(
        dvbpsi_pat_sections_generate(handle.get(), pat.get(), 253));
    if (copySection(patSections.get(), mPat) != 0) {
        return 1;
    }

    std::unique_ptr<dvbpsi_pmt_t, PmtDeleter> pmt(
        dvbpsi_pmt_new(options.programNumber, 0, true, options.effectivePcrPid()));
    if (!pmt) {
        return 1;
    }
    auto addEs = [&](uint8_t type, uint16_t pid, uint8_t componentTag) -> dvbpsi_pmt_es_t* {
        dvbpsi_pmt_es_t* es = dvbpsi_pmt_es_add(pmt.get(), type, pid);
        if (es == nullptr) {
            return nullptr;
        }
        uint8_t tag = componentTag;
        if (dvbpsi_pmt_es_descriptor_add(es, kTagStreamIdentifier, 1, &tag) == nullptr) {
            return nullptr;
        }
        return es;
    };
    if (addEs(kStreamTypeH264, options.videoPid, 0x00) == nullptr) {
        return 1;
    }
    if (options.audioCodec != AudioCodec::kNone &&
        addEs(static_cast<uint8_t>(options.effectiveAudioStreamType()), options.audioPid, 0x10) ==
            nullptr) {
        return 1;
    }
    if (options.captionStream) {
        dvbpsi_pmt_es_t* es = addEs(kStreamTypePrivatePes, options.captionPid, 0x30);
        // data_component_id 0x0008, then additional_arib_caption_info (ARIB STD-B10):
        // DMF 0b0011, two reserved bits set, Timing 0b01 (programme-synchronous).
        uint8_t component[3] = {0x00, 0x08, 0x3D};
        if (es == nullptr || dvbpsi_pmt_es_descriptor_add(es, kTagDataComponent, sizeof component,
                                                          component) == nullptr) {
            return 1;
        }
    }
    std::unique_ptr<dvbpsi_psi_section_t, SectionDeleter> pmtSections(
        dvbpsi_pmt_sections_generate(handle.get(), pmt.get()));
    return copySection(pmtSections.get(), mPmt);
}

}  // namespace TavoPlayer::tsgen
