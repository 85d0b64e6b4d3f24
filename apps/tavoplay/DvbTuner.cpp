#include "DvbTuner.h"

#include <fcntl.h>
#include <linux/dvb/dmx.h>
#include <poll.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <iterator>
#include <thread>
#include <utility>
#include <vector>

#include <libdvbv5/dvb-fe.h>
#include <libdvbv5/dvb-file.h>
#include <libdvbv5/dvb-v5-std.h>

namespace tavoplay {

namespace {

constexpr size_t kTsPacketBytes = 188;
constexpr uint16_t kAllPids = 0x2000;
constexpr int kDemuxBufferBytes = 2 << 20;
constexpr auto kLockPoll = std::chrono::milliseconds(100);

std::string firstLine(std::string text) {
    while (!text.empty() && (text.back() == '\n' || text.back() == ' '))
        text.pop_back();
    const size_t end = text.find('\n');
    text = text.substr(0, end);
    // libdvbv5 starts its messages with the severity word.
    for (const char* word : {"ERROR", "WARNING"})
        if (text.rfind(word, 0) == 0)
            text = text.substr(text.find_first_not_of(' ', std::strlen(word)));
    return text;
}

// libdvbv5 writes the errors of its file parser straight to standard error; they
// are taken here so that tavoplay can give them as part of its one line.
class StderrCapture {
public:
    StderrCapture() {
        std::fflush(stderr);
        mFile = memfd_create("dvbv5-messages", MFD_CLOEXEC);
        mSaved = dup(STDERR_FILENO);
        if (mFile >= 0 && mSaved >= 0)
            dup2(mFile, STDERR_FILENO);
    }
    ~StderrCapture() { restore(); }
    std::string text() {
        restore();
        std::string out;
        if (mFile < 0)
            return out;
        char buffer[4096];
        ssize_t n;
        lseek(mFile, 0, SEEK_SET);
        while ((n = read(mFile, buffer, sizeof buffer)) > 0)
            out.append(buffer, static_cast<size_t>(n));
        return out;
    }

private:
    void restore() {
        if (mSaved >= 0) {
            std::fflush(stderr);
            dup2(mSaved, STDERR_FILENO);
            ::close(mSaved);
            mSaved = -1;
        }
    }
    int mFile = -1;
    int mSaved = -1;
};

// The frontend library's messages: the last error is kept for the reason line.
std::string gFrontendMessage;

void frontendLog(int level, const char* format, ...) {
    if (level > 4)  // LOG_WARNING and above only
        return;
    char text[512];
    va_list args;
    va_start(args, format);
    std::vsnprintf(text, sizeof text, format, args);
    va_end(args);
    gFrontendMessage = firstLine(text);
}

std::string withDetail(std::string reason, const std::string& detail) {
    if (!detail.empty())
        reason += " (" + detail + ")";
    return reason;
}

}  // namespace

struct DvbTuner::Channel {
    uint32_t deliverySystem = SYS_UNDEFINED;
    std::vector<std::pair<uint32_t, uint32_t>> properties;  // DVBv5 command, value
};

bool parseDvbSource(const std::string& source, DvbAddress* out) {
    if (source.rfind("dvb:", 0) != 0)
        return false;
    int adapter = -1, demux = 0, used = 0;
    const char* text = source.c_str() + 4;
    if (std::sscanf(text, "%d%n", &adapter, &used) != 1 || adapter < 0)
        return false;
    if (text[used] == '.') {
        const char* rest = text + used + 1;
        int more = 0;
        if (std::sscanf(rest, "%d%n", &demux, &more) != 1 || demux < 0 || rest[more] != '\0')
            return false;
    } else if (text[used] != '\0') {
        return false;
    }
    out->adapter = adapter;
    out->demux = demux;
    return true;
}

std::string dvbDemuxPath(const DvbAddress& address) {
    const char* root = getenv("TAVOPLAYER_DVB_ROOT");
    return std::string(root != nullptr && *root != '\0' ? root : "/dev/dvb") + "/adapter" +
           std::to_string(address.adapter) + "/demux" + std::to_string(address.demux);
}

DvbTuner::~DvbTuner() {
    if (mFrontend != nullptr)
        dvb_fe_close(mFrontend);
    delete mChannel;
}

std::string DvbTuner::findChannel(const std::string& channelsFile, const std::string& channel) {
    struct stat st {};
    if (stat(channelsFile.c_str(), &st) != 0)
        return "cannot open the channel file " + channelsFile + ": " + std::strerror(errno);
    dvb_file* file = nullptr;
    std::string messages;
    {
        StderrCapture capture;
        file = dvb_read_file_format(channelsFile.c_str(), SYS_UNDEFINED, FILE_DVBV5);
        messages = capture.text();
    }
    if (file == nullptr)
        return withDetail(channelsFile + " is not a dvbv5 channel file", firstLine(messages));
    if (file->first_entry == nullptr) {
        dvb_file_free(file);
        return channelsFile + " lists no channels";
    }
    std::string reason = "no channel '" + channel + "' in " + channelsFile;
    for (dvb_entry* entry = file->first_entry; entry != nullptr; entry = entry->next) {
        const bool named = entry->channel != nullptr && channel == entry->channel;
        const bool numbered = entry->vchannel != nullptr && channel == entry->vchannel;
        if (!named && !numbered)
            continue;
        auto* found = new Channel();
        for (unsigned i = 0; i < entry->n_props; ++i) {
            const uint32_t cmd = entry->props[i].cmd;
            const uint32_t value = entry->props[i].u.data;
            if (cmd == DTV_DELIVERY_SYSTEM)
                found->deliverySystem = value;
            else if (cmd < DTV_USER_COMMAND_START)  // the rest are the file's own fields
                found->properties.emplace_back(cmd, value);
        }
        if (found->deliverySystem == SYS_UNDEFINED) {
            delete found;
            reason = "channel '" + channel + "' in " + channelsFile + " has no DELIVERY_SYSTEM";
            break;
        }
        delete mChannel;
        mChannel = found;
        mChannelName = channel;
        mServiceId = entry->service_id;
        reason.clear();
        break;
    }
    dvb_file_free(file);
    return reason;
}

std::string DvbTuner::tune(const DvbAddress& address, std::chrono::milliseconds lockWait) {
    if (mChannel == nullptr)
        return "no channel chosen";
    // libdvbv5 finds frontends under /dev/dvb; a missing one is said plainly first.
    const std::string path = "/dev/dvb/adapter" + std::to_string(address.adapter) + "/frontend0";
    if (access(path.c_str(), F_OK) != 0)
        return "no DVB adapter " + std::to_string(address.adapter) + " (" + path + ": " +
               std::strerror(errno) + ")";
    gFrontendMessage.clear();
    mFrontend = dvb_fe_open_flags(address.adapter, 0, 0, 0, frontendLog, O_RDWR);
    if (mFrontend == nullptr)
        return withDetail("cannot open the DVB frontend " + path, gFrontendMessage);
    if (dvb_set_compat_delivery_system(mFrontend, mChannel->deliverySystem) != 0) {
        const uint32_t system = mChannel->deliverySystem;
        const char* name = system < std::size(delivery_system_name) ? delivery_system_name[system]
                                                                    : "this delivery system";
        return withDetail(
            "the frontend " + path + " cannot receive " + name + " for '" + mChannelName + "'",
            gFrontendMessage);
    }
    // Properties another delivery system would have (a file written for a
    // different tuner) are refused one by one and do not stop the tuning.
    for (const auto& [cmd, value] : mChannel->properties)
        dvb_fe_store_parm(mFrontend, cmd, value);
    if (dvb_fe_set_parms(mFrontend) != 0)
        return withDetail(
            "the frontend " + path + " refused the parameters of '" + mChannelName + "'",
            gFrontendMessage);
    const auto deadline = std::chrono::steady_clock::now() + lockWait;
    uint32_t status = 0;
    for (;;) {
        if (dvb_fe_get_stats(mFrontend) == 0)
            dvb_fe_retrieve_stats(mFrontend, DTV_STATUS, &status);
        if ((status & FE_HAS_LOCK) != 0)
            return "";
        if (std::chrono::steady_clock::now() >= deadline)
            break;
        std::this_thread::sleep_for(kLockPoll);
    }
    const char* seen = (status & FE_HAS_SYNC)      ? "sync but no lock"
                       : (status & FE_HAS_CARRIER) ? "a carrier but no sync"
                       : (status & FE_HAS_SIGNAL)  ? "a signal but no carrier"
                                                   : "no signal";
    char text[256];
    std::snprintf(text, sizeof text, "no lock on '%s' within %.1f s (%s)", mChannelName.c_str(),
                  lockWait.count() / 1000.0, seen);
    return text;
}

std::string readDvbStream(const DvbAddress& address, std::chrono::milliseconds wait,
                          size_t maxBytes,
                          const std::function<bool(const uint8_t*, size_t)>& feed) {
    const std::string path = dvbDemuxPath(address);
    const int fd = open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
    if (fd < 0)
        return "cannot open DVB demux " + path + ": " + std::strerror(errno);
    ioctl(fd, DMX_SET_BUFFER_SIZE, kDemuxBufferBytes);  // the default only delays overflow
    dmx_pes_filter_params params{};
    params.pid = kAllPids;
    params.input = DMX_IN_FRONTEND;
    params.output = DMX_OUT_TSDEMUX_TAP;
    params.pes_type = DMX_PES_OTHER;
    params.flags = DMX_IMMEDIATE_START;
    if (ioctl(fd, DMX_SET_PES_FILTER, &params) != 0) {
        const std::string reason =
            "the DVB demux " + path + " refused a filter on every PID: " + std::strerror(errno);
        close(fd);
        return reason;
    }
    std::vector<uint8_t> buffer(kTsPacketBytes * 1024);
    size_t total = 0;
    bool done = false;
    auto deadline = std::chrono::steady_clock::now() + wait;
    while (!done && total < maxBytes && std::chrono::steady_clock::now() < deadline) {
        pollfd p{fd, POLLIN, 0};
        if (poll(&p, 1, 200) <= 0)
            continue;
        const ssize_t n = read(fd, buffer.data(), buffer.size());
        if (n <= 0)
            continue;  // EOVERFLOW: the kernel dropped packets; read on
        total += static_cast<size_t>(n);
        done = feed(buffer.data(), static_cast<size_t>(n));
        deadline = std::chrono::steady_clock::now() + wait;  // quiet time, not total time
    }
    ioctl(fd, DMX_STOP);
    close(fd);
    if (total == 0)
        return "nothing arrived from " + path + " within " + std::to_string(wait.count() / 1000) +
               " s (is the frontend tuned?)";
    return "";
}

}  // namespace tavoplay
