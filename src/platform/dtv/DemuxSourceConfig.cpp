#include "platform/dtv/DemuxSourceConfig.h"

#include <charconv>
#include <optional>

namespace TavoPlayer {

namespace {

std::optional<long> parseNumber(const std::string& text) {
    long value = 0;
    const char* end = text.data() + text.size();
    auto [ptr, ec] = std::from_chars(text.data(), end, value);
    if (text.empty() || ec != std::errc() || ptr != end)
        return std::nullopt;
    return value;
}

bool parseOptions(const std::string& options, DemuxSourceConfig* config, bool* overflowGiven,
                  std::string* error) {
    size_t start = 0;
    while (start <= options.size()) {
        size_t end = options.find('&', start);
        if (end == std::string::npos)
            end = options.size();
        const std::string item = options.substr(start, end - start);
        start = end + 1;
        if (item.empty()) {
            if (end == options.size())
                break;
            continue;
        }
        const size_t eq = item.find('=');
        if (eq == std::string::npos) {
            *error = "option \"" + item + "\" has no value";
            return false;
        }
        const std::string name = item.substr(0, eq);
        const std::string value = item.substr(eq + 1);
        if (name == "loop") {
            if (value != "0" && value != "1") {
                *error = "loop must be 0 or 1";
                return false;
            }
            config->loop = value == "1";
        } else if (name == "pace") {
            if (value != "pcr" && value != "none") {
                *error = "pace must be pcr or none";
                return false;
            }
            config->paced = value == "pcr";
        } else if (name == "queue") {
            const auto n = parseNumber(value);
            if (!n || *n < static_cast<long>(DemuxSourceConfig::kMinQueuePackets) ||
                *n > static_cast<long>(DemuxSourceConfig::kMaxQueuePackets)) {
                *error = "queue must be a packet count from 16 to 1048576";
                return false;
            }
            config->queuePackets = static_cast<size_t>(*n);
        } else if (name == "overflow") {
            if (value != "drop" && value != "wait") {
                *error = "overflow must be drop or wait";
                return false;
            }
            config->overflow = value == "wait" ? DemuxSourceConfig::Overflow::kWait
                                               : DemuxSourceConfig::Overflow::kDrop;
            *overflowGiven = true;
        } else if (name == "iface") {
            config->iface = value;
        } else {
            *error = "unknown option \"" + name + "\"";
            return false;
        }
        if (end == options.size())
            break;
    }
    return true;
}

}  // namespace

bool DemuxSourceConfig::parse(const std::string& text, DemuxSourceConfig* config,
                              std::string* error) {
    DemuxSourceConfig result;
    std::string body = text;
    std::string options;
    // The options follow the last '?', so that a path may not contain one, but
    // a URL-like body needs no escaping otherwise.
    const size_t question = text.rfind('?');
    if (question != std::string::npos) {
        body = text.substr(0, question);
        options = text.substr(question + 1);
    }
    if (body.rfind("file:", 0) == 0) {
        result.kind = Kind::kFile;
        result.path = body.substr(5);
        if (result.path.empty()) {
            *error = "file: needs a path";
            return false;
        }
    } else if (body.rfind("udp://", 0) == 0) {
        result.kind = Kind::kUdp;
        const std::string address = body.substr(6);
        const size_t colon = address.rfind(':');
        if (colon == std::string::npos) {
            *error = "udp:// needs GROUP:PORT";
            return false;
        }
        result.host = address.substr(0, colon);
        if (result.host.size() >= 2 && result.host.front() == '[' && result.host.back() == ']') {
            result.host = result.host.substr(1, result.host.size() - 2);
        }
        const auto port = parseNumber(address.substr(colon + 1));
        if (!port || *port < 1 || *port > 65535) {
            *error = "udp:// port must be 1..65535";
            return false;
        }
        result.port = static_cast<int>(*port);
    } else if (body == "stdin") {
        result.kind = Kind::kStdin;
    } else if (body.rfind("dvb:", 0) == 0) {
        result.kind = Kind::kDvb;
        const std::string device = body.substr(4);
        const size_t dot = device.find('.');
        const auto adapter = parseNumber(device.substr(0, dot));
        if (!adapter || *adapter < 0 || *adapter > 255) {
            *error = "dvb: needs ADAPTER[.DEMUX] with numbers 0..255";
            return false;
        }
        result.adapter = static_cast<int>(*adapter);
        if (dot != std::string::npos) {
            const auto demux = parseNumber(device.substr(dot + 1));
            if (!demux || *demux < 0 || *demux > 255) {
                *error = "dvb: needs ADAPTER[.DEMUX] with numbers 0..255";
                return false;
            }
            result.demux = static_cast<int>(*demux);
        }
    } else {
        *error = "unknown source \"" + text + "\" (file:PATH, udp://GROUP:PORT, stdin, dvb:N)";
        return false;
    }
    bool overflowGiven = false;
    if (!parseOptions(options, &result, &overflowGiven, error))
        return false;
    if (!overflowGiven && result.kind == Kind::kFile && !result.paced) {
        // Unpaced, a file has no real time to keep up with: losing packets to a
        // reader that is merely slower would only hide data.
        result.overflow = Overflow::kWait;
    }
    *config = result;
    return true;
}

}  // namespace TavoPlayer
