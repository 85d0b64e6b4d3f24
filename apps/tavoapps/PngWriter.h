// Writes a captured frame as a PNG file with FFmpeg's PNG encoder.
#pragma once

#include <cstdint>
#include <string>

namespace tavoapps {

// `pixels` holds width x height 32-bit pixels 0xAARRGGBB in host order, as the
// service's frame capture makes them, srcWidth x srcHeight; the PNG is scaled to
// width x height. Alpha is dropped (the picture is opaque). Returns an empty
// string on success, otherwise the reason.
std::string writeArgbPng(const std::string& path, const uint8_t* pixels, int srcWidth,
                         int srcHeight, int width, int height);

}  // namespace tavoapps
