#include "platform/os/Trace.h"

#include <pthread.h>
#include <syslog.h>
#include <time.h>

#include <strings.h>
#include <atomic>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <mutex>

namespace TavoPlayer {
namespace {

// Severity words are ordered by their top byte: error 0x80 > ... > debug 0x10.
// A message passes when its word is at least the configured one.
constexpr uint32_t kTraceNone = TRACE_NONE;

std::atomic<uint32_t> gLevel{TRACE_INFO};
std::atomic<bool> gInitialized{false};
std::atomic<bool> gUseSyslog{false};
std::mutex gSinkMutex;
TraceSink gSink;
std::atomic<bool> gHaveSink{false};

thread_local const char* tFile = "";
thread_local int tLine = 0;

uint32_t parseLevel(const char* text) {
    if (text == nullptr)
        return TRACE_INFO;
    if (strcasecmp(text, "error") == 0)
        return TRACE_ERROR;
    if (strcasecmp(text, "warning") == 0 || strcasecmp(text, "warn") == 0)
        return TRACE_WARNING;
    if (strcasecmp(text, "info") == 0)
        return TRACE_INFO;
    if (strcasecmp(text, "debug") == 0)
        return TRACE_DEBUG;
    if (strcasecmp(text, "none") == 0 || strcasecmp(text, "off") == 0)
        return kTraceNone;
    return TRACE_INFO;
}

const char* severityName(uint32_t severity) {
    switch (severity) {
        case TRACE_ERROR:
            return "E";
        case TRACE_WARNING:
            return "W";
        case TRACE_INFO:
            return "I";
        case TRACE_DEBUG:
            return "D";
        default:
            return "?";
    }
}

int syslogPriority(uint32_t severity) {
    switch (severity) {
        case TRACE_ERROR:
            return LOG_ERR;
        case TRACE_WARNING:
            return LOG_WARNING;
        case TRACE_INFO:
            return LOG_INFO;
        default:
            return LOG_DEBUG;
    }
}

const char* baseName(const char* path) {
    const char* slash = strrchr(path, '/');
    return slash != nullptr ? slash + 1 : path;
}

void writeLine(const TraceRecord& record) {
    char threadName[16] = "?";
    pthread_getname_np(pthread_self(), threadName, sizeof threadName);
    // The message's own newline is the line's end; add one where it has none.
    size_t len = record.text.size();
    while (len > 0 && record.text[len - 1] == '\n')
        --len;
    if (gUseSyslog.load(std::memory_order_relaxed)) {
        syslog(syslogPriority(record.severity), "%s [%s] %s:%d %.*s", severityName(record.severity),
               threadName, baseName(record.file), record.line, static_cast<int>(len),
               record.text.c_str());
        return;
    }
    timespec now{};
    clock_gettime(CLOCK_MONOTONIC, &now);
    fprintf(stderr, "%5lld.%03ld %s [%s] %s:%d %.*s\n", static_cast<long long>(now.tv_sec),
            now.tv_nsec / 1000000, severityName(record.severity), threadName, baseName(record.file),
            record.line, static_cast<int>(len), record.text.c_str());
}

}  // namespace

TraceSink setTraceSink(TraceSink sink) {
    std::lock_guard<std::mutex> lock(gSinkMutex);
    TraceSink previous = std::move(gSink);
    gSink = std::move(sink);
    gHaveSink.store(static_cast<bool>(gSink), std::memory_order_release);
    return previous;
}

void setTraceLevel(uint32_t severity) {
    OneSegPGL_InitializeDebug();
    gLevel.store(severity, std::memory_order_relaxed);
}

}  // namespace TavoPlayer

using namespace TavoPlayer;

void OneSegPGL_InitializeDebug() {
    bool expected = false;
    if (!gInitialized.compare_exchange_strong(expected, true))
        return;
    gLevel.store(parseLevel(getenv("TAVOPLAYER_LOG_LEVEL")), std::memory_order_relaxed);
    const char* output = getenv("TAVOPLAYER_LOG_OUTPUT");
    if (output != nullptr && strcasecmp(output, "syslog") == 0) {
        openlog("tavoplayer", LOG_PID, LOG_DAEMON);
        gUseSyslog.store(true, std::memory_order_relaxed);
    }
}

void OneSegPGL_SetDebugLocation(const char* file, int line) {
    tFile = file != nullptr ? file : "";
    tLine = line;
}

bool OneSegPGL_TraceEnabled(uint32_t severity) {
    if (!gInitialized.load(std::memory_order_acquire))
        OneSegPGL_InitializeDebug();
    // A capturing sink sees everything, so tests do not depend on the environment.
    if (gHaveSink.load(std::memory_order_acquire))
        return true;
    const uint32_t level = gLevel.load(std::memory_order_relaxed);
    return level != kTraceNone && severity >= level;
}

void OneSegPGL_Trace(uint32_t severity, const char* format, ...) {
    if (!OneSegPGL_TraceEnabled(severity))
        return;
    char stackBuffer[512];
    va_list args;
    va_start(args, format);
    va_list copy;
    va_copy(copy, args);
    const int needed = vsnprintf(stackBuffer, sizeof stackBuffer, format, args);
    va_end(args);
    TraceRecord record{severity, tFile, tLine, {}};
    if (needed < 0) {
        record.text = format;
    } else if (static_cast<size_t>(needed) < sizeof stackBuffer) {
        record.text.assign(stackBuffer, static_cast<size_t>(needed));
    } else {
        record.text.resize(static_cast<size_t>(needed) + 1);
        vsnprintf(record.text.data(), record.text.size(), format, copy);
        record.text.resize(static_cast<size_t>(needed));
    }
    va_end(copy);

    if (gHaveSink.load(std::memory_order_acquire)) {
        std::lock_guard<std::mutex> lock(gSinkMutex);
        if (gSink) {
            gSink(record);
            return;
        }
    }
    writeLine(record);
}
