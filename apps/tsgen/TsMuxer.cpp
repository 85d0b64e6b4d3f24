#include "TsMuxer.h"

#include <algorithm>
#include <cmath>
#include <cstring>

namespace TavoPlayer::tsgen {

namespace {

constexpr size_t kPacketSize = 188;
constexpr uint16_t kPatPid = 0x0000;
constexpr uint16_t kNullPid = 0x1FFF;
constexpr int64_t kTicks33 = int64_t{1} << 33;
// PCR(0) lies this far before the first decoding time: the receiver's buffer
// fills for that long before the first picture is due.
constexpr int64_t kInitialDelay90 = 63000;  // 700 ms
// A PES may leave at most this long before its decoding time.
constexpr int64_t kSendWindow90 = 72000;  // 800 ms

int64_t mod33(int64_t t) {
    return ((t % kTicks33) + kTicks33) % kTicks33;
}

void putTimestamp(std::vector<uint8_t>& out, uint8_t prefix, int64_t t) {
    // ISO/IEC 13818-1, 2.4.3.7: 33 bits in 3, 15 and 15 bit parts, each
    // followed by a marker bit.
    const auto v = static_cast<uint64_t>(mod33(t));
    out.push_back(static_cast<uint8_t>((prefix << 4) | ((v >> 29) & 0x0E) | 1));
    out.push_back(static_cast<uint8_t>(v >> 22));
    out.push_back(static_cast<uint8_t>(((v >> 14) & 0xFE) | 1));
    out.push_back(static_cast<uint8_t>(v >> 7));
    out.push_back(static_cast<uint8_t>(((v << 1) & 0xFE) | 1));
}

}  // namespace

TsMuxer::TsMuxer(const Options& options, const PsiWriter& psi, FaultInjector& faults)
    : mOptions(options), mPsi(psi), mFaults(faults) {
    mRate = options.effectiveMuxRate();
    // B-frames make the first decoding time precede the first PTS.
    const int64_t reorder90 =
        90000LL * options.fpsDen / options.fpsNum * (options.bframes > 0 ? 2 : 0);
    mStart27 = (options.startPts - reorder90 - kInitialDelay90) * 300;
}

void TsMuxer::addStream(uint16_t pid, uint8_t streamId, Source source) {
    Stream s;
    s.pid = pid;
    s.streamId = streamId;
    s.source = std::move(source);
    mStreams.push_back(std::move(s));
}

std::vector<uint8_t> TsMuxer::pesHeader(uint8_t streamId, const PesUnit& unit) {
    std::vector<uint8_t> h = {0x00, 0x00, 0x01, streamId, 0, 0};
    const bool dts = unit.hasPts && unit.hasDts;
    // '10', not scrambled, data_alignment_indicator when an access unit starts here.
    h.push_back(unit.aligned ? 0x84 : 0x80);
    h.push_back(!unit.hasPts ? 0x00 : dts ? 0xC0 : 0x80);
    h.push_back(!unit.hasPts ? 0 : dts ? 10 : 5);
    if (unit.hasPts) {
        putTimestamp(h, dts ? 0x3 : 0x2, unit.pts);
    }
    if (dts) {
        putTimestamp(h, 0x1, unit.dts);
    }
    const size_t length = h.size() - 6 + unit.payload.size();
    // 2.4.3.7: 0 (unbounded) is allowed only for video in transport streams.
    const size_t field = length <= 0xFFFF ? length : 0;
    h[4] = static_cast<uint8_t>(field >> 8);
    h[5] = static_cast<uint8_t>(field);
    return h;
}

int TsMuxer::load(Stream& s) {
    PesUnit unit;
    const int rc = s.source(unit);
    if (rc < 0) {
        return rc;
    }
    if (rc == 1) {
        s.ended = true;
        s.loaded = false;
        return 0;
    }
    s.pes = pesHeader(s.streamId, unit);
    s.pes.insert(s.pes.end(), unit.payload.begin(), unit.payload.end());
    s.offset = 0;
    s.dts90 = unit.hasDts ? unit.dts : unit.pts;
    s.randomAccess = unit.randomAccess;
    unit.payload.clear();
    s.unit = std::move(unit);
    s.loaded = true;
    return 0;
}

int64_t TsMuxer::slotTime27(uint64_t slot) const {
    const unsigned __int128 bits =
        static_cast<unsigned __int128>(slot) * kPacketSize * 8 * 27000000;
    return mStart27 + static_cast<int64_t>(bits / static_cast<unsigned __int128>(mRate));
}

uint8_t TsMuxer::currentCc(uint16_t pid) {
    for (auto& [p, cc] : mCc) {
        if (p == pid) {
            return cc;
        }
    }
    // The first payload packet of a PID gets counter 0.
    mCc.emplace_back(pid, 0x0F);
    return 0x0F;
}

uint8_t TsMuxer::nextCc(uint16_t pid) {
    currentCc(pid);
    for (auto& [p, cc] : mCc) {
        if (p == pid) {
            cc = static_cast<uint8_t>((cc + 1) & 0x0F);
            return cc;
        }
    }
    return 0;
}

void TsMuxer::putPcr(uint8_t* p, int64_t pcr27) {
    // ISO/IEC 13818-1, 2.4.3.5: 33-bit base at 90 kHz, 6 reserved bits, 9-bit
    // extension at 27 MHz.
    const int64_t wrapped = ((pcr27 % (kTicks33 * 300)) + kTicks33 * 300) % (kTicks33 * 300);
    const auto base = static_cast<uint64_t>(wrapped / 300);
    const auto ext = static_cast<uint32_t>(wrapped % 300);
    p[0] = static_cast<uint8_t>(base >> 25);
    p[1] = static_cast<uint8_t>(base >> 17);
    p[2] = static_cast<uint8_t>(base >> 9);
    p[3] = static_cast<uint8_t>(base >> 1);
    p[4] = static_cast<uint8_t>(((base & 1) << 7) | 0x7E | (ext >> 8));
    p[5] = static_cast<uint8_t>(ext);
}

void TsMuxer::writeSection(uint8_t* packet, uint16_t pid, const std::vector<uint8_t>& section) {
    packet[0] = 0x47;
    packet[1] = static_cast<uint8_t>(0x40 | (pid >> 8));
    packet[2] = static_cast<uint8_t>(pid);
    packet[3] = static_cast<uint8_t>(0x10 | nextCc(pid));
    packet[4] = 0;  // pointer_field: the section starts right here
    std::memset(packet + 5, 0xFF, kPacketSize - 5);
    std::memcpy(packet + 5, section.data(), std::min(section.size(), kPacketSize - 5));
}

void TsMuxer::writeNull(uint8_t* packet) {
    packet[0] = 0x47;
    packet[1] = static_cast<uint8_t>(kNullPid >> 8);
    packet[2] = static_cast<uint8_t>(kNullPid & 0xFF);
    packet[3] = 0x10;
    std::memset(packet + 4, 0xFF, kPacketSize - 4);
}

void TsMuxer::writePcrOnly(uint8_t* packet, uint16_t pid, int64_t pcr27) {
    packet[0] = 0x47;
    packet[1] = static_cast<uint8_t>(pid >> 8);
    packet[2] = static_cast<uint8_t>(pid);
    // Adaptation field only: the counter does not advance (2.4.3.3).
    packet[3] = static_cast<uint8_t>(0x20 | currentCc(pid));
    packet[4] = 183;
    packet[5] = mDiscontinuityPending ? 0x90 : 0x10;  // discontinuity_indicator, PCR_flag
    putPcr(packet + 6, pcr27);
    std::memset(packet + 12, 0xFF, kPacketSize - 12);
}

void TsMuxer::writePayloadPacket(uint8_t* packet, Stream& s, bool withPcr, int64_t pcr27) {
    const bool start = s.offset == 0;
    if (start && mShift90 != 0) {
        // After a time-base change every PES that starts is stamped on the new
        // time base (ISO/IEC 13818-1, 2.4.3.5, discontinuity_indicator); the
        // header keeps its size, so it is rewritten in place.
        PesUnit shifted = s.unit;
        shifted.pts += mShift90;
        shifted.dts += mShift90;
        const auto header = pesHeader(s.streamId, shifted);
        std::copy(header.begin() + 6, header.end(), s.pes.begin() + 6);
    }
    const bool randomAccess = start && s.randomAccess;
    const size_t remaining = s.pes.size() - s.offset;
    // Adaptation field: flags byte when a PCR or the random access indicator is
    // needed, then stuffing so that the last packet of the PES is full.
    size_t afBytes = 0;  // including the adaptation_field_length byte
    if (withPcr) {
        afBytes = 8;
    } else if (randomAccess) {
        afBytes = 2;
    }
    size_t payload = std::min(remaining, kPacketSize - 4 - afBytes);
    if (payload < kPacketSize - 4 - afBytes) {
        afBytes = kPacketSize - 4 - payload;
    }
    packet[0] = 0x47;
    packet[1] = static_cast<uint8_t>((start ? 0x40 : 0x00) | (s.pid >> 8));
    packet[2] = static_cast<uint8_t>(s.pid);
    packet[3] = static_cast<uint8_t>((afBytes > 0 ? 0x30 : 0x10) | nextCc(s.pid));
    uint8_t* p = packet + 4;
    if (afBytes > 0) {
        p[0] = static_cast<uint8_t>(afBytes - 1);
        if (afBytes > 1) {
            // 2.4.3.4: adaptation_field_length 0 is a single stuffing byte with no flags.
            const bool discontinuity = withPcr && mDiscontinuityPending;
            p[1] = static_cast<uint8_t>((discontinuity ? 0x80 : 0) | (randomAccess ? 0x40 : 0) |
                                        (withPcr ? 0x10 : 0));
            size_t used = 2;
            if (withPcr) {
                putPcr(p + 2, pcr27);
                used = 8;
            }
            std::memset(p + used, 0xFF, afBytes - used);
        }
        p += afBytes;
    }
    std::memcpy(p, s.pes.data() + s.offset, payload);
    s.offset += payload;
}

int TsMuxer::run(std::FILE* out) {
    for (auto& s : mStreams) {
        if (load(s) != 0) {
            mError = "a stream source failed";
            return 1;
        }
    }
    const int64_t pcrInterval27 = static_cast<int64_t>(mOptions.pcrIntervalMs) * 27000;
    const int64_t psiInterval27 = static_cast<int64_t>(mOptions.psiIntervalMs) * 27000;
    const uint16_t pcrPid = mOptions.effectivePcrPid();
    const int64_t faultBase27 = mOptions.startPts * 300;
    const int64_t end27 =
        faultBase27 + static_cast<int64_t>(std::llround(mOptions.durationSec * 27e6));
    int64_t nextPsi27 = INT64_MIN;
    int64_t nextPcr27 = INT64_MIN;
    bool pmtPending = false;
    uint8_t packet[kPacketSize];
    mStats.firstPcr27 = mStart27;

    for (uint64_t slot = 0;; ++slot) {
        const int64_t now27 = slotTime27(slot);
        const bool anyData =
            std::any_of(mStreams.begin(), mStreams.end(), [](const Stream& s) { return s.loaded; });
        // Once everything is sent, the multiplex runs on (tables, PCR, null
        // packets) until the clock reaches the end of the contents, as a
        // broadcast would; the last PES leave up to the send window early.
        if (!anyData && !pmtPending && now27 >= end27) {
            break;
        }
        // Streams whose next PES may leave now, the earliest decoding time first.
        Stream* due = nullptr;
        for (auto& s : mStreams) {
            if (s.loaded && now27 >= (s.dts90 - kSendWindow90) * 300 &&
                (due == nullptr || s.dts90 < due->dts90)) {
                due = &s;
            }
        }
        // A new time base takes effect with the next PCR, sent at once: from
        // that packet on, the PCR and every PES that starts use it.
        const int64_t shift90 = mFaults.timebaseShift90(now27 - faultBase27);
        if (shift90 != mShift90 && !mDiscontinuityPending) {
            mDiscontinuityPending = true;
            nextPcr27 = now27;
        }

        if (pmtPending) {
            writeSection(packet, mOptions.pmtPid, mPsi.pmtSection());
            pmtPending = false;
        } else if (now27 >= nextPsi27) {
            writeSection(packet, kPatPid, mPsi.patSection());
            pmtPending = true;
            nextPsi27 = (nextPsi27 == INT64_MIN ? now27 : nextPsi27) + psiInterval27;
        } else if (now27 >= nextPcr27) {
            if (mDiscontinuityPending) {
                mShift90 = shift90;
            }
            const int64_t pcr27 = now27 + mFaults.pcrOffset27(now27 - faultBase27) + mShift90 * 300;
            Stream* carrier = (due != nullptr && due->pid == pcrPid) ? due : nullptr;
            if (carrier == nullptr) {
                for (auto& s : mStreams) {
                    if (s.pid == pcrPid && s.loaded && s.offset > 0) {
                        carrier = &s;  // a PES already under way on the PCR PID
                    }
                }
            }
            if (carrier != nullptr) {
                writePayloadPacket(packet, *carrier, true, pcr27);
                due = carrier;
            } else {
                writePcrOnly(packet, pcrPid, pcr27);
                due = nullptr;
            }
            mDiscontinuityPending = false;
            nextPcr27 = (nextPcr27 == INT64_MIN ? now27 : nextPcr27) + pcrInterval27;
        } else if (due != nullptr) {
            writePayloadPacket(packet, *due, false, 0);
        } else {
            writeNull(packet);
            ++mStats.nullPackets;
        }

        // A PES that has been sent whole makes room for the next one of its stream.
        if (due != nullptr && due->loaded && due->offset >= due->pes.size()) {
            ++mStats.pesPackets;
            if (now27 > due->dts90 * 300) {
                ++mStats.latePes;
            }
            if (load(*due) != 0) {
                mError = "a stream source failed";
                return 1;
            }
        }

        ++mStats.packets;
        if (mFaults.apply(packet, now27 - faultBase27)) {
            // A 204-byte packet carries 16 more bytes (Reed-Solomon parity, or the
            // ISDB-T information of ABNT NBR 15601); receivers discard them.
            static const uint8_t kTrailer[16] = {};
            const size_t trailer = mOptions.packetSize > 188 ? sizeof kTrailer : 0;
            if (std::fwrite(packet, 1, kPacketSize, out) != kPacketSize ||
                std::fwrite(kTrailer, 1, trailer, out) != trailer) {
                mError = "cannot write the output";
                return 1;
            }
            ++mStats.packetsWritten;
        }
    }
    return 0;
}

}  // namespace TavoPlayer::tsgen
