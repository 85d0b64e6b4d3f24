// The tuner demux service's client calls.
//
// A filter hands out the whole 188-byte TS packets of one PID, in arrival order.
// Handles are small non-negative integers; a handle set is a fixed 132-byte value
// (one bit per handle, kDemuxMaxHandles of them) that callers copy freely.
//
// Every call is thread-safe. DemuxBinder_Select and DemuxBinder_ReadData are meant
// for one reader thread (the TS receiver); filters are started and stopped by the
// controller's thread while that reader runs.
//
// Where the packets come from is chosen by the property tavoplayer.demux.source
// (docs/demux.md). The source is opened by the first DemuxBinder_StartFiltering and
// closed when the last filter stops, so a later StartFiltering reads the property
// again.
#pragma once

#include <cstdint>

namespace TavoPlayer {

constexpr int kDemuxHandleSetWords = 33;
constexpr int kDemuxMaxHandles = kDemuxHandleSetWords * 32;
constexpr int kTsPacketSize = 188;

// Filter kinds, as the receiver passes them. The Linux demux delivers whole TS
// packets whatever the kind; the kind is kept for diagnostics.
constexpr int kDemuxFilterPcr = 0;
constexpr int kDemuxFilterPes = 1;
constexpr int kDemuxFilterVideo = 2;

struct DemuxHandleSet {
    uint32_t bits[kDemuxHandleSetWords];
};
static_assert(sizeof(DemuxHandleSet) == 132, "the handle set is a 132-byte value");

// Starts a filter for `pid` (0..0x1FFF). Returns a handle >= 0, or a negative value
// when the PID or kind is invalid or the source cannot be opened.
int DemuxBinder_StartFiltering(unsigned short pid, int filterKind);

// Stops the filter; its queued packets are dropped. Returns 0, or -1 for an unknown
// handle. Stopping the last filter closes the source.
int DemuxBinder_StopFiltering(int handle);

// Waits until a filter of `set` has packets or `timeoutMs` milliseconds (monotonic
// clock) have passed; a negative time-out waits without limit. On return `set` holds
// the ready handles. Returns the number ready, 0 on time-out, negative on error
// (null set). Handles in the set that are not open are never ready.
int DemuxBinder_Select(DemuxHandleSet* set, int timeoutMs);

// Copies as many whole queued packets of the filter as fit in `size` bytes. Returns
// the byte count (a multiple of 188), 0 when nothing is queued, negative for an
// unknown handle, a null buffer or a size below one packet.
int DemuxBinder_ReadData(int handle, unsigned char* buffer, int size);

void DemuxBinder_HandleZERO(DemuxHandleSet* set);
// A handle outside 0..kDemuxMaxHandles-1 (such as -1 for a failed filter) is ignored.
void DemuxBinder_HandleSET(int handle, DemuxHandleSet* set);
// Non-zero when `handle` is in `set`; 0 for a handle outside the valid range.
int DemuxBinder_HandleISSET(int handle, const DemuxHandleSet* set);

}  // namespace TavoPlayer
