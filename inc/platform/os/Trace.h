// The program's trace facility.
//
// Every message goes through OneSegPGL_Trace with one of four severity words. The
// caller records its source file and line first (OneSegPGL_SetDebugLocation); the
// TAVO_LOG* macros do both, and skip formatting when the level filters the message
// out. By convention the first %s of every format is the logging operation's name:
//     TAVO_LOGE("%s: RingBuffer already configured\n", __func__);
//
// Output: one line per message with monotonic time, severity, thread name, source
// file and line. The level comes from TAVOPLAYER_LOG_LEVEL (error, warning, info,
// debug or none; default info); TAVOPLAYER_LOG_OUTPUT=syslog sends lines to syslog
// instead of stderr. Tests install a sink to see exactly what was logged.
#pragma once

#include <cstdint>
#include <functional>
#include <string>

namespace TavoPlayer {

enum TraceSeverity : uint32_t {
    TRACE_ERROR = 0x80000800u,
    TRACE_WARNING = 0x40000800u,
    TRACE_INFO = 0x20000800u,
    TRACE_DEBUG = 0x10000800u,
    // Not a message severity: as a level, nothing is written.
    TRACE_NONE = 0xFFFFFFFFu,
};

// One formatted message as the facility saw it; handed to an installed sink.
struct TraceRecord {
    uint32_t severity;
    const char* file;
    int line;
    std::string text;  // the formatted message, trailing newline included if given
};

using TraceSink = std::function<void(const TraceRecord&)>;

// Replaces the output with `sink` (an empty function restores stderr/syslog).
// Returns the sink that was installed before. Thread-safe.
TraceSink setTraceSink(TraceSink sink);

// Sets the level from here on, overriding TAVOPLAYER_LOG_LEVEL.
void setTraceLevel(uint32_t severity);

}  // namespace TavoPlayer

// Reads the level and output from the environment. Safe to call more than once;
// the first trace call does it implicitly.
void OneSegPGL_InitializeDebug();

// Records the caller's source position for the next trace call of this thread.
void OneSegPGL_SetDebugLocation(const char* file, int line);

// True when a message of this severity would be written.
bool OneSegPGL_TraceEnabled(uint32_t severity);

void OneSegPGL_Trace(uint32_t severity, const char* format, ...)
    __attribute__((format(printf, 2, 3)));

#define TAVO_TRACE_AT(sev, ...)                             \
    do {                                                    \
        if (OneSegPGL_TraceEnabled(sev)) {                  \
            OneSegPGL_SetDebugLocation(__FILE__, __LINE__); \
            OneSegPGL_Trace(sev, __VA_ARGS__);              \
        }                                                   \
    } while (0)

#define TAVO_LOGE(...) TAVO_TRACE_AT(::TavoPlayer::TRACE_ERROR, __VA_ARGS__)
#define TAVO_LOGW(...) TAVO_TRACE_AT(::TavoPlayer::TRACE_WARNING, __VA_ARGS__)
#define TAVO_LOGI(...) TAVO_TRACE_AT(::TavoPlayer::TRACE_INFO, __VA_ARGS__)
#define TAVO_LOGD(...) TAVO_TRACE_AT(::TavoPlayer::TRACE_DEBUG, __VA_ARGS__)
