#include "H264SpsEditor.h"

#include "BitWriter.h"

namespace TavoPlayer::tsgen {

namespace {

constexpr uint8_t kNalSps = 7;

bool skipScalingList(BitReader& r, int size) {
    // ITU-T H.264, 7.3.2.1.1.1.
    int32_t lastScale = 8;
    int32_t nextScale = 8;
    for (int j = 0; j < size; ++j) {
        if (nextScale != 0) {
            int32_t delta = 0;
            if (!r.getSe(delta)) {
                return false;
            }
            nextScale = (lastScale + delta + 256) % 256;
        }
        lastScale = nextScale == 0 ? lastScale : nextScale;
    }
    return true;
}

// Walks seq_parameter_set_data() (ITU-T H.264, 7.3.2.1.1) up to
// vui_parameters_present_flag and returns that flag's bit position.
bool findVuiFlag(BitReader& r, size_t& position) {
    uint32_t v = 0;
    uint32_t profile = 0;
    if (!r.getBits(8, profile) || !r.getBits(16, v) || !r.getUe(v)) {
        return false;
    }
    switch (profile) {
        case 100:
        case 110:
        case 122:
        case 244:
        case 44:
        case 83:
        case 86:
        case 118:
        case 128:
        case 138:
        case 139:
        case 134:
        case 135: {
            uint32_t chroma = 0;
            if (!r.getUe(chroma)) {
                return false;
            }
            if (chroma == 3 && !r.getBits(1, v)) {
                return false;
            }
            uint32_t scalingPresent = 0;
            if (!r.getUe(v) || !r.getUe(v) || !r.getBits(1, v) || !r.getBits(1, scalingPresent)) {
                return false;
            }
            if (scalingPresent) {
                const int lists = chroma != 3 ? 8 : 12;
                for (int i = 0; i < lists; ++i) {
                    uint32_t present = 0;
                    if (!r.getBits(1, present)) {
                        return false;
                    }
                    if (present && !skipScalingList(r, i < 6 ? 16 : 64)) {
                        return false;
                    }
                }
            }
            break;
        }
        default:
            break;
    }
    uint32_t pocType = 0;
    if (!r.getUe(v) || !r.getUe(pocType)) {
        return false;
    }
    if (pocType == 0) {
        if (!r.getUe(v)) {
            return false;
        }
    } else if (pocType == 1) {
        int32_t s = 0;
        uint32_t cycle = 0;
        if (!r.getBits(1, v) || !r.getSe(s) || !r.getSe(s) || !r.getUe(cycle)) {
            return false;
        }
        for (uint32_t i = 0; i < cycle; ++i) {
            if (!r.getSe(s)) {
                return false;
            }
        }
    }
    uint32_t frameMbsOnly = 0;
    if (!r.getUe(v) || !r.getBits(1, v) || !r.getUe(v) || !r.getUe(v) ||
        !r.getBits(1, frameMbsOnly)) {
        return false;
    }
    if (!frameMbsOnly && !r.getBits(1, v)) {
        return false;
    }
    uint32_t cropping = 0;
    if (!r.getBits(1, v) || !r.getBits(1, cropping)) {
        return false;
    }
    if (cropping && (!r.getUe(v) || !r.getUe(v) || !r.getUe(v) || !r.getUe(v))) {
        return false;
    }
    position = r.position();
    return r.getBits(1, v);
}

}  // namespace

std::vector<uint8_t> H264SpsEditor::toRbsp(const uint8_t* data, size_t size) {
    std::vector<uint8_t> out;
    out.reserve(size);
    int zeros = 0;
    for (size_t i = 0; i < size; ++i) {
        if (zeros >= 2 && data[i] == 0x03) {
            zeros = 0;
            continue;
        }
        out.push_back(data[i]);
        zeros = data[i] == 0 ? zeros + 1 : 0;
    }
    return out;
}

std::vector<uint8_t> H264SpsEditor::toEbsp(const std::vector<uint8_t>& rbsp) {
    std::vector<uint8_t> out;
    out.reserve(rbsp.size() + rbsp.size() / 64 + 1);
    int zeros = 0;
    for (uint8_t b : rbsp) {
        if (zeros >= 2 && b <= 0x03) {
            out.push_back(0x03);
            zeros = 0;
        }
        out.push_back(b);
        zeros = b == 0 ? zeros + 1 : 0;
    }
    return out;
}

int H264SpsEditor::stripVuiFromNal(const std::vector<uint8_t>& nal, std::vector<uint8_t>& out) {
    if (nal.size() < 2 || (nal[0] & 0x1F) != kNalSps) {
        return 1;
    }
    const std::vector<uint8_t> rbsp = toRbsp(nal.data() + 1, nal.size() - 1);
    BitReader reader(rbsp.data(), rbsp.size());
    size_t vuiFlag = 0;
    if (!findVuiFlag(reader, vuiFlag)) {
        return 1;
    }
    BitWriter writer;
    BitReader copy(rbsp.data(), rbsp.size());
    for (size_t done = 0; done < vuiFlag;) {
        const int chunk = static_cast<int>(std::min<size_t>(16, vuiFlag - done));
        uint32_t bits = 0;
        copy.getBits(chunk, bits);
        writer.putBits(bits, chunk);
        done += static_cast<size_t>(chunk);
    }
    writer.putBits(0, 1);  // vui_parameters_present_flag
    writer.putBits(1, 1);  // rbsp_stop_one_bit (7.3.2.11)
    writer.alignZero();
    out.clear();
    out.push_back(nal[0]);
    const std::vector<uint8_t> ebsp = toEbsp(writer.bytes());
    out.insert(out.end(), ebsp.begin(), ebsp.end());
    return 0;
}

int H264SpsEditor::stripVui(std::vector<uint8_t>& accessUnit) {
    // Split at Annex B start codes (ITU-T H.264, B.2) and rebuild with 4-byte
    // start codes before each unit, as x264 writes them for parameter sets.
    std::vector<std::pair<size_t, size_t>> units;  // payload start, end
    const size_t n = accessUnit.size();
    size_t i = 0;
    size_t start = SIZE_MAX;
    while (i + 3 <= n) {
        if (accessUnit[i] == 0 && accessUnit[i + 1] == 0 && accessUnit[i + 2] == 1) {
            if (start != SIZE_MAX) {
                size_t end = i;
                while (end > start && accessUnit[end - 1] == 0) {
                    --end;
                }
                units.emplace_back(start, end);
            }
            start = i + 3;
            i += 3;
        } else {
            ++i;
        }
    }
    if (start == SIZE_MAX) {
        return 1;
    }
    units.emplace_back(start, n);

    std::vector<uint8_t> rebuilt;
    rebuilt.reserve(n + 16);
    int status = 0;
    for (const auto& [s, e] : units) {
        std::vector<uint8_t> nal(accessUnit.begin() + static_cast<std::ptrdiff_t>(s),
                                 accessUnit.begin() + static_cast<std::ptrdiff_t>(e));
        const uint8_t startCode[4] = {0, 0, 0, 1};
        if (!nal.empty() && (nal[0] & 0x1F) == kNalSps) {
            std::vector<uint8_t> edited;
            if (stripVuiFromNal(nal, edited) == 0) {
                nal.swap(edited);
            } else {
                status = 1;
            }
        }
        rebuilt.insert(rebuilt.end(), startCode, startCode + 4);
        rebuilt.insert(rebuilt.end(), nal.begin(), nal.end());
    }
    if (status == 0) {
        accessUnit.swap(rebuilt);
    }
    return status;
}

}  // namespace TavoPlayer::tsgen
