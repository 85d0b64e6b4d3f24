// Module error codes: 0xK100N, K the kind of module (1 TS receiver, 2 TS parser,
// 3 decoder, 4 renderer), N the failure within it. Operations return 0 for
// success, 1 for a refusal, or one of these.
#pragma once

namespace TavoPlayer {

constexpr unsigned int OK = 0;
constexpr unsigned int REFUSED = 1;

// TS receiver (the decoder reports the first as well when a worker cannot stop).
constexpr unsigned int ERROR_TSRECEIVER_PID_OR_THREAD = 0x11001;  // no such PID, filter or thread
constexpr unsigned int ERROR_TSRECEIVER_NO_PID = 0x11002;         // start with no PID set
constexpr unsigned int ERROR_TSRECEIVER_PID_COUNT = 0x11003;      // PIDs differ from outputs
constexpr unsigned int ERROR_TSRECEIVER_FILTERING = 0x11004;      // filtering cannot start

// TS parser (the recorded-clip player reports the first for its player events).
constexpr unsigned int ERROR_TSPARSER_START_STOP = 0x21001;
constexpr unsigned int ERROR_TSPARSER_NO_INPUT = 0x21002;
constexpr unsigned int ERROR_TSPARSER_SCRAMBLED = 0x21003;

// Decoders.
constexpr unsigned int ERROR_DECODER_UNSUPPORTED_CODING = 0x31001;
constexpr unsigned int ERROR_DECODER_CODEC = 0x31002;
constexpr unsigned int ERROR_DECODER_FATAL = 0x31004;  // treated as fatal, like 1
constexpr unsigned int ERROR_DECODER_CROP_UNSUPPORTED = 0x31008;

// Renderers.
constexpr unsigned int ERROR_RENDERER_SHORT_WRITE = 0x41001;
constexpr unsigned int ERROR_RENDERER_WRONG_RECORD = 0x41003;
constexpr unsigned int ERROR_RENDERER_NO_OUTPUT = 0x41004;

}  // namespace TavoPlayer
