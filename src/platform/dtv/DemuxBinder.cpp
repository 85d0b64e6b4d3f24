#include "platform/dtv/DemuxBinder.h"

#include <cstring>

#include "platform/dtv/Demux.h"

namespace TavoPlayer {

int DemuxBinder_StartFiltering(unsigned short pid, int filterKind) {
    return Demux::instance().startFiltering(pid, filterKind);
}

int DemuxBinder_StopFiltering(int handle) {
    return Demux::instance().stopFiltering(handle);
}

int DemuxBinder_Select(DemuxHandleSet* set, int timeoutMs) {
    return Demux::instance().select(set, timeoutMs);
}

int DemuxBinder_ReadData(int handle, unsigned char* buffer, int size) {
    return Demux::instance().readData(handle, buffer, size);
}

void DemuxBinder_HandleZERO(DemuxHandleSet* set) {
    if (set != nullptr)
        std::memset(set, 0, sizeof *set);
}

void DemuxBinder_HandleSET(int handle, DemuxHandleSet* set) {
    if (set == nullptr || handle < 0 || handle >= kDemuxMaxHandles)
        return;
    set->bits[handle / 32] |= 1u << (handle % 32);
}

int DemuxBinder_HandleISSET(int handle, const DemuxHandleSet* set) {
    if (set == nullptr || handle < 0 || handle >= kDemuxMaxHandles)
        return 0;
    return (set->bits[handle / 32] >> (handle % 32)) & 1u;
}

}  // namespace TavoPlayer
