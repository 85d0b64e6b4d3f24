#include "TsgenTestUtil.h"

#include <algorithm>
#include <memory>
#include <sstream>

namespace TavoPlayer::test {

std::vector<uint8_t> hex(const std::string& text) {
    std::istringstream in(text);
    std::vector<uint8_t> out;
    for (unsigned byte = 0; in >> std::hex >> byte;)
        out.push_back(static_cast<uint8_t>(byte));
    return out;
}

bool contains(const std::vector<uint8_t>& bytes, const std::string& hexBytes) {
    const auto part = hex(hexBytes);
    return std::search(bytes.begin(), bytes.end(), part.begin(), part.end()) != bytes.end();
}

std::string decodeErrors(const std::string& file) {
    return runCommand("ffmpeg -nostdin -v error -i '" + file + "' -f null -").err;
}

std::vector<std::pair<uint64_t, int64_t>> pcrAnomalies(const TsFile& ts, int64_t muxRate) {
    std::vector<std::pair<uint64_t, int64_t>> anomalies;
    const ParsedPacket* previous = nullptr;
    for (const auto& p : ts.packets) {
        if (p.hasPcr && previous != nullptr) {
            const int64_t slots = static_cast<int64_t>(p.position - previous->position);
            const int64_t excess = p.pcr27 - previous->pcr27 - slots * ticks27PerPacket(muxRate);
            if (excess > 1 || excess < -1)
                anomalies.emplace_back(p.position, excess);
        }
        previous = p.hasPcr ? &p : previous;
    }
    return anomalies;
}

const Generated& tsgen(const std::string& args) {
    static std::map<std::string, std::unique_ptr<Generated>> made;
    auto& slot = made[args];
    if (!slot) {
        const std::string file = tempPath("gen" + std::to_string(made.size()) + ".ts");
        auto run = runCommand(std::string(TAVO_TSGEN_PATH) + " -o '" + file + "' " + args);
        auto bytes = fileBytes(file);
        const size_t packetSize = args.find("--packet-size 204") != std::string::npos ? 204 : 188;
        slot.reset(new Generated{std::move(run), file, bytes, TsFile(bytes, packetSize)});
    }
    return *slot;
}

std::vector<int> nalTypes(const std::vector<uint8_t>& es) {
    std::vector<int> types;
    for (size_t i = 0; i + 3 < es.size(); ++i)
        if (es[i] == 0 && es[i + 1] == 0 && es[i + 2] == 1)
            types.push_back(es[i + 3] & 0x1F);
    return types;
}

}  // namespace TavoPlayer::test
