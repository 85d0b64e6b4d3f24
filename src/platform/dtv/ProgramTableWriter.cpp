#include "platform/dtv/ProgramTableWriter.h"

#include <dvbpsi/descriptor.h>
#include <dvbpsi/dvbpsi.h>
#include <dvbpsi/pat.h>
#include <dvbpsi/pmt.h>
#include <dvbpsi/psi.h>

#include <algorithm>
#include <memory>

namespace TavoPlayer {

namespace {

constexpr size_t kPacket = 188;

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

// Every section of the list, end to end (each with its own header and CRC).
bool copySections(const dvbpsi_psi_section_t* section, std::vector<uint8_t>& out) {
    out.clear();
    for (; section != nullptr; section = section->p_next) {
        const size_t size = static_cast<size_t>(section->p_payload_end - section->p_data) + 4;
        out.insert(out.end(), section->p_data, section->p_data + size);
    }
    return !out.empty();
}

// Walks a raw descriptor loop; false when it is malformed.
template <typename Add>
bool addDescriptors(const std::vector<uint8_t>& raw, Add add) {
    for (size_t i = 0; i + 2 <= raw.size();) {
        const uint8_t tag = raw[i];
        const uint8_t length = raw[i + 1];
        if (i + 2 + length > raw.size())
            return false;
        if (!add(tag, length, const_cast<uint8_t*>(raw.data() + i + 2)))
            return false;
        i += 2u + length;
    }
    return true;
}

}  // namespace

bool ProgramTableWriter::build(const ProgramInfo& program, const std::vector<uint16_t>& pids) {
    std::unique_ptr<dvbpsi_t, DvbpsiDeleter> handle(dvbpsi_new(nullptr, DVBPSI_MSG_NONE));
    if (!handle)
        return false;
    std::unique_ptr<dvbpsi_pat_t, PatDeleter> pat(
        dvbpsi_pat_new(program.transportStreamId, 0, true));
    if (!pat || dvbpsi_pat_program_add(pat.get(), program.programNumber, program.pmtPid) == nullptr)
        return false;
    std::unique_ptr<dvbpsi_psi_section_t, SectionDeleter> patSections(
        dvbpsi_pat_sections_generate(handle.get(), pat.get(), 253));
    std::vector<uint8_t> patBytes;
    if (!copySections(patSections.get(), patBytes))
        return false;

    std::unique_ptr<dvbpsi_pmt_t, PmtDeleter> pmt(
        dvbpsi_pmt_new(program.programNumber, 0, true, program.pcrPid));
    if (!pmt)
        return false;
    if (!addDescriptors(program.descriptors, [&](uint8_t tag, uint8_t length, uint8_t* data) {
            return dvbpsi_pmt_descriptor_add(pmt.get(), tag, length, data) != nullptr;
        })) {
        return false;
    }
    for (const ProgramStream& s : program.streams) {
        if (std::find(pids.begin(), pids.end(), s.pid) == pids.end())
            continue;
        dvbpsi_pmt_es_t* es = dvbpsi_pmt_es_add(pmt.get(), s.streamType, s.pid);
        if (es == nullptr)
            return false;
        if (!addDescriptors(s.descriptors, [&](uint8_t tag, uint8_t length, uint8_t* data) {
                return dvbpsi_pmt_es_descriptor_add(es, tag, length, data) != nullptr;
            })) {
            return false;
        }
    }
    std::unique_ptr<dvbpsi_psi_section_t, SectionDeleter> pmtSections(
        dvbpsi_pmt_sections_generate(handle.get(), pmt.get()));
    std::vector<uint8_t> pmtBytes;
    if (!copySections(pmtSections.get(), pmtBytes))
        return false;
    mPat = std::move(patBytes);
    mPmt = std::move(pmtBytes);
    mPmtPid = program.pmtPid;
    return true;
}

void ProgramTableWriter::appendSection(const std::vector<uint8_t>& section, uint16_t pid,
                                       uint8_t& counter, std::vector<uint8_t>& out) const {
    // ISO/IEC 13818-1, 2.4.4.1: the first packet of a section sets
    // payload_unit_start_indicator and starts its payload with pointer_field 0; the
    // rest of the last packet is stuffed with 0xFF.
    size_t done = 0;
    bool first = true;
    while (done < section.size() || first) {
        const size_t start = out.size();
        out.resize(start + kPacket, 0xFF);
        uint8_t* p = out.data() + start;
        p[0] = 0x47;
        p[1] = static_cast<uint8_t>((first ? 0x40 : 0x00) | ((pid >> 8) & 0x1F));
        p[2] = static_cast<uint8_t>(pid & 0xFF);
        p[3] = static_cast<uint8_t>(0x10 | (counter & 0x0F));  // payload only
        counter = static_cast<uint8_t>((counter + 1) & 0x0F);
        size_t at = 4;
        if (first)
            p[at++] = 0x00;
        const size_t n = std::min(kPacket - at, section.size() - done);
        std::copy(section.begin() + static_cast<std::ptrdiff_t>(done),
                  section.begin() + static_cast<std::ptrdiff_t>(done + n), p + at);
        done += n;
        first = false;
    }
}

void ProgramTableWriter::append(std::vector<uint8_t>& out) {
    if (mPat.empty() || mPmt.empty())
        return;
    appendSection(mPat, 0x0000, mPatCounter, out);
    appendSection(mPmt, mPmtPid, mPmtCounter, out);
}

size_t ProgramTableWriter::packetsPerRepetition() const {
    auto packets = [](size_t bytes) { return bytes == 0 ? 0 : (bytes + 1 + 183) / 184; };
    return packets(mPat.size()) + packets(mPmt.size());
}

}  // namespace TavoPlayer
