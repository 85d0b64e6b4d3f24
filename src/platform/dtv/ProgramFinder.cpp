#include "platform/dtv/ProgramFinder.h"

#include <dvbpsi/descriptor.h>
#include <dvbpsi/dvbpsi.h>
#include <dvbpsi/pat.h>
#include <dvbpsi/pmt.h>
#include <dvbpsi/psi.h>

#include <algorithm>
#include <map>

namespace TavoPlayer {

namespace {

constexpr uint8_t kStreamTypePrivatePes = 0x06;
constexpr uint8_t kTagStreamIdentifier = 0x52;       // ISO/IEC 13818-1, 2.6 / ARIB STD-B10
constexpr uint8_t kTagDataComponent = 0xFD;          // ARIB STD-B10
constexpr uint16_t kDataComponentCaptions = 0x0008;  // ARIB STD-B24 captions

std::vector<uint8_t> rawDescriptors(const dvbpsi_descriptor_t* d) {
    std::vector<uint8_t> out;
    for (; d != nullptr; d = d->p_next) {
        out.push_back(d->i_tag);
        out.push_back(d->i_length);
        out.insert(out.end(), d->p_data, d->p_data + d->i_length);
    }
    return out;
}

uint16_t pidOf(const uint8_t* packet) {
    return static_cast<uint16_t>(((packet[1] & 0x1f) << 8) | packet[2]);
}

}  // namespace

struct ProgramFinder::Decoders {
    struct Pmt {
        dvbpsi_t* handle = nullptr;
        uint16_t programNumber = 0;
    };
    ProgramFinder* owner = nullptr;
    dvbpsi_t* pat = nullptr;
    std::map<uint16_t, Pmt> pmts;  // by PMT PID

    ~Decoders() {
        if (pat != nullptr) {
            dvbpsi_pat_detach(pat);
            dvbpsi_delete(pat);
        }
        for (auto& [pid, pmt] : pmts) {
            dvbpsi_pmt_detach(pmt.handle);
            dvbpsi_delete(pmt.handle);
        }
    }

    static void onPat(void* data, dvbpsi_pat_t* pat) {
        auto* self = static_cast<Decoders*>(data);
        ProgramFinder& finder = *self->owner;
        finder.mHavePat = true;
        finder.mTransportStreamId = pat->i_ts_id;
        for (const dvbpsi_pat_program_t* p = pat->p_first_program; p != nullptr; p = p->p_next) {
            if (p->i_number == 0)  // network_PID, not a programme (2.4.4.3)
                continue;
            if (self->pmts.count(p->i_pid) != 0)
                continue;
            dvbpsi_t* handle = dvbpsi_new(nullptr, DVBPSI_MSG_NONE);
            if (handle == nullptr)
                continue;
            if (!dvbpsi_pmt_attach(handle, p->i_number, &Decoders::onPmt, self)) {
                dvbpsi_delete(handle);
                continue;
            }
            self->pmts[p->i_pid] = Pmt{handle, p->i_number};
            finder.mPmtPids.push_back(p->i_pid);
        }
        dvbpsi_pat_delete(pat);
    }

    static void onPmt(void* data, dvbpsi_pmt_t* pmt) {
        auto* self = static_cast<Decoders*>(data);
        ProgramFinder& finder = *self->owner;
        bool carries = false;
        for (const dvbpsi_pmt_es_t* es = pmt->p_first_es; es != nullptr; es = es->p_next)
            carries = carries || es->i_pid == finder.mPid;
        if (finder.mByProgram)
            carries = finder.mProgramNumber == 0 || pmt->i_program_number == finder.mProgramNumber;
        if (carries && !finder.mProgram) {
            ProgramInfo info;
            info.transportStreamId = finder.mTransportStreamId;
            info.programNumber = pmt->i_program_number;
            for (const auto& [pid, decoder] : self->pmts) {
                if (decoder.programNumber == pmt->i_program_number)
                    info.pmtPid = pid;
            }
            info.pcrPid = pmt->i_pcr_pid;
            info.descriptors = rawDescriptors(pmt->p_first_descriptor);
            for (const dvbpsi_pmt_es_t* es = pmt->p_first_es; es != nullptr; es = es->p_next)
                info.streams.push_back(
                    {es->i_type, es->i_pid, rawDescriptors(es->p_first_descriptor)});
            finder.mProgram = std::move(info);
        }
        dvbpsi_pmt_delete(pmt);
    }
};

const ProgramStream* ProgramInfo::stream(uint16_t pid) const {
    for (const ProgramStream& s : streams) {
        if (s.pid == pid)
            return &s;
    }
    return nullptr;
}

const ProgramStream* ProgramInfo::captionStream() const {
    for (const ProgramStream& s : streams) {
        if (s.streamType != kStreamTypePrivatePes)
            continue;
        const std::vector<uint8_t>& d = s.descriptors;
        for (size_t i = 0; i + 2 <= d.size(); i += 2u + d[i + 1]) {
            const uint8_t tag = d[i];
            const uint8_t length = d[i + 1];
            if (i + 2 + length > d.size())
                break;
            if (tag == kTagStreamIdentifier && length >= 1 && d[i + 2] >= 0x30 && d[i + 2] <= 0x37)
                return &s;
            if (tag == kTagDataComponent && length >= 2 &&
                ((d[i + 2] << 8) | d[i + 3]) == kDataComponentCaptions)
                return &s;
        }
    }
    return nullptr;
}

std::unique_ptr<ProgramFinder> ProgramFinder::forProgram(uint16_t programNumber) {
    auto finder = std::make_unique<ProgramFinder>(0);
    finder->mByProgram = true;
    finder->mProgramNumber = programNumber;
    return finder;
}

ProgramFinder::ProgramFinder(uint16_t pid) : mPid(pid), mDecoders(std::make_unique<Decoders>()) {
    mDecoders->owner = this;
    mDecoders->pat = dvbpsi_new(nullptr, DVBPSI_MSG_NONE);
    if (mDecoders->pat != nullptr &&
        !dvbpsi_pat_attach(mDecoders->pat, &Decoders::onPat, mDecoders.get())) {
        dvbpsi_delete(mDecoders->pat);
        mDecoders->pat = nullptr;
    }
}

ProgramFinder::~ProgramFinder() = default;

void ProgramFinder::push(const uint8_t* packet) {
    if (packet[0] != 0x47 || mProgram)
        return;
    // libdvbpsi takes a non-const pointer but only reads the packet.
    uint8_t copy[188];
    std::copy(packet, packet + 188, copy);
    const uint16_t pid = pidOf(packet);
    if (pid == 0) {
        if (mDecoders->pat != nullptr)
            dvbpsi_packet_push(mDecoders->pat, copy);
        return;
    }
    auto it = mDecoders->pmts.find(pid);
    if (it != mDecoders->pmts.end())
        dvbpsi_packet_push(it->second.handle, copy);
}

}  // namespace TavoPlayer
