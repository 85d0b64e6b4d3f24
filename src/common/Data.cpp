#include "common/data/Data.h"

#include <cstdarg>
#include <cstdio>
#include <cstring>

namespace TavoPlayer {

void Data::appendLine(char* buffer, const char* format, ...) {
    const size_t used = strnlen(buffer, kToStringBufferSize);
    if (used + 1 >= kToStringBufferSize)
        return;
    va_list args;
    va_start(args, format);
    vsnprintf(buffer + used, kToStringBufferSize - used, format, args);
    va_end(args);
}

std::string Data::toString() {
    char buffer[kToStringBufferSize] = {};
    appendLine(buffer, "mType = %u\n", mType);
    appendLine(buffer, "mSize = %u\n", mSize);
    return buffer;
}

bool Data::fromString(char* text) {
    return text != nullptr && sscanf(text, "mType = %u\nmSize = %u\n", &mType, &mSize) == 2;
}

int Data::getRaw(unsigned char** data, unsigned int* size) {
    *data = nullptr;
    *size = 0;
    return 0;
}

}  // namespace TavoPlayer
