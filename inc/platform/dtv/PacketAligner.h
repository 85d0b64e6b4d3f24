// PacketAligner: finds whole TS packets in a byte stream.
//
// Bytes arrive in pieces of any size (file reads, datagrams, pipe reads); whole
// 188-byte packets come out. The aligner locks onto a sync byte 0x47 that repeats
// at the packet period (ISO/IEC 13818-1, 2.4.3.2: sync_byte is 0x47 at the start of
// every packet). It accepts 188-byte packets and 204-byte packets (188 bytes plus a
// 16-byte Reed-Solomon or ISDB-T information trailer, which is dropped), so that
// captures of either form can be played.
//
// Lost sync is never fatal: bytes that do not belong to a packet are skipped and
// counted, and the sync byte is searched for again. A packet is only handed out
// once the sync byte of the packet after it has been seen (or at the end of the
// stream). When that byte is not where it should be, the packet is held until the
// next packet is found: if that one starts inside it, the packet was cut short and
// is dropped rather than delivered with another packet's bytes in it; otherwise it
// was whole and garbage (or a packet with a damaged sync byte) followed it.
//
// Pure: no I/O and no locks; one thread uses an aligner.
#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

namespace TavoPlayer {

class PacketAligner {
public:
    static constexpr size_t kPacketSize = 188;
    static constexpr size_t kRsPacketSize = 204;
    static constexpr uint8_t kSyncByte = 0x47;

    // Appends `size` bytes; every whole packet now known is appended to `out`
    // (188 bytes each). Returns the number of packets appended.
    size_t push(const uint8_t* data, size_t size, std::vector<uint8_t>& out);
    // End of the stream: hands out the packet still held back, if whole, and drops
    // what remains. Returns the number of bytes dropped (a truncated last packet).
    // The aligner then starts afresh.
    size_t finish(std::vector<uint8_t>& out);
    void reset();

    // 188 or 204 while locked, 0 while searching.
    size_t packetSize() const { return mPacketSize; }
    // Times that a locked stream lost its sync.
    uint64_t syncLosses() const { return mSyncLosses; }
    // Bytes skipped while searching for sync (garbage, and broken packets).
    uint64_t bytesSkipped() const { return mBytesSkipped; }
    uint64_t packetsOut() const { return mPacketsOut; }

private:
    enum class Lock { kYes, kNo, kNeedMore };
    size_t process(bool finishing, std::vector<uint8_t>& out);
    Lock tryLock(size_t at, size_t period, bool finishing) const;
    void emit(size_t at, std::vector<uint8_t>& out);

    static constexpr size_t kNone = static_cast<size_t>(-1);

    std::vector<uint8_t> mPending;
    size_t mPos = 0;          // first unprocessed byte of mPending
    size_t mSuspect = kNone;  // a packet whose successor was not where it should be
    size_t mPacketSize = 0;
    uint64_t mSyncLosses = 0;
    uint64_t mBytesSkipped = 0;
    uint64_t mPacketsOut = 0;
};

}  // namespace TavoPlayer
