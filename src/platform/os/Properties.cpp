#include "platform/os/Properties.h"

#include <algorithm>
#include <cctype>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <optional>

namespace TavoPlayer {
namespace {

constexpr const char* kDefaultPropertyFile = "/etc/tavoplayer/system.prop";

std::string trim(const std::string& text) {
    size_t begin = 0;
    size_t end = text.size();
    while (begin < end && isspace(static_cast<unsigned char>(text[begin])))
        ++begin;
    while (end > begin && isspace(static_cast<unsigned char>(text[end - 1])))
        --end;
    return text.substr(begin, end - begin);
}

std::optional<std::string> fromEnvironment(const std::string& key) {
    std::string name = "TAVOPLAYER_PROP_" + key;
    for (char& c : name) {
        if (c == '.')
            c = '_';
    }
    const char* value = getenv(name.c_str());
    if (value == nullptr)
        return std::nullopt;
    return std::string(value);
}

std::optional<std::string> fromFile(const std::string& key) {
    const char* path = getenv("TAVOPLAYER_PROPERTIES");
    std::ifstream in(path != nullptr ? path : kDefaultPropertyFile);
    if (!in)
        return std::nullopt;
    std::optional<std::string> found;
    std::string line;
    while (std::getline(in, line)) {
        const std::string text = trim(line);
        if (text.empty() || text[0] == '#')
            continue;
        const size_t eq = text.find('=');
        if (eq == std::string::npos)
            continue;
        // A later line for the same key wins, as when properties are layered.
        if (trim(text.substr(0, eq)) == key)
            found = trim(text.substr(eq + 1));
    }
    return found;
}

}  // namespace

std::string propertyGetString(const std::string& key, const std::string& defaultValue) {
    if (auto value = fromEnvironment(key))
        return *value;
    if (auto value = fromFile(key))
        return *value;
    return defaultValue;
}

int property_get(const char* key, char* value, const char* defaultValue) {
    if (value == nullptr)
        return 0;
    const std::string result =
        key == nullptr ? std::string(defaultValue != nullptr ? defaultValue : "")
                       : propertyGetString(key, defaultValue != nullptr ? defaultValue : "");
    const size_t length = std::min(result.size(), static_cast<size_t>(kPropertyValueMax - 1));
    memcpy(value, result.data(), length);
    value[length] = '\0';
    return static_cast<int>(length);
}

}  // namespace TavoPlayer
