// A process that records from the demux source its environment names, so that the
// recording tests can kill a recording mid-way or limit the size of its file.
//
//   tavo_recording_child kill         records until killed
//   tavo_recording_child fsize=BYTES  records with files limited to BYTES, until an
//                                     event ends the recording; then stops it
//
// Prints the recording's number on the first line, and "event N" when one came.
#include <signal.h>
#include <sys/resource.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <thread>

#include "platform/dtv/RecPlayerBinder.h"

using namespace TavoPlayer;

namespace {
std::atomic<int> sEvent{-1};
void onEvent(int event, void*) {
    sEvent.store(event);
}
}  // namespace

int main(int argc, char** argv) {
    const std::string mode = argc > 1 ? argv[1] : "kill";
    if (mode.rfind("fsize=", 0) == 0) {
        const rlimit limit{std::strtoull(mode.c_str() + 6, nullptr, 10),
                           std::strtoull(mode.c_str() + 6, nullptr, 10)};
        setrlimit(RLIMIT_FSIZE, &limit);
        signal(SIGXFSZ, SIG_IGN);  // the write fails with EFBIG instead
    }
    if (RecPlayerBinder_CreateTSRecorder(0, 0, 0x111, 0x112, 1, onEvent, nullptr) != 1 ||
        RecPlayerBinder_AnyMoreRecordings() != 1 || RecPlayerBinder_StartTSRecorder() != 1) {
        std::printf("failed\n");
        return 1;
    }
    RecDetails* details = RecPlayerBinder_GetCurrTSRecDetails();
    std::printf("%d\n", details != nullptr ? details->fileNumName : 0);
    std::fflush(stdout);
    if (details != nullptr) {
        free(details->stationName);
        free(details->prgName);
        free(details);
    }
    if (mode == "kill") {
        for (;;)
            pause();
    }
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(60);
    while (sEvent.load() < 0 && std::chrono::steady_clock::now() < deadline)
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
    std::printf("event %d\n", sEvent.load());
    const int stopped = RecPlayerBinder_StopTSRecorder();
    RecPlayerBinder_DeleteTSRecorder();
    std::fflush(stdout);
    return stopped == 1 ? 0 : 2;
}
