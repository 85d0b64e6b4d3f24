// ClosedCaptionListener: where caption text leaves the pipeline. The player service
// implements it and forwards the text to its client; the caption renderer calls it
// on its own thread, once per caption, when the caption is due.
#pragma once

namespace TavoPlayer {

class ClosedCaptionListener {
public:
    virtual ~ClosedCaptionListener() = default;

    // `text` is the caption as 32-bit Unicode code points in host byte order: rows
    // top to bottom, a row shorter than 32 characters followed by code point 10, no
    // terminator. It points into the renderer's input ring and is valid only during
    // the call; `length` is its size in bytes (4 per code point).
    virtual void onClosedCaptionReceived(unsigned char* text, int length) = 0;
};

}  // namespace TavoPlayer
