#include "core/message.h"

#include <atomic>
#include <cstdio>
#include <mutex>

namespace ox {
namespace {

constexpr uint32_t kDefaultMask = kMsgProgress | kMsgWarning | kMsgInfo | kMsgBench | kMsgError;
constexpr const char *kDebugBanner =
    " +++++++++++++++ KESTRIN RENDERER DEBUG MESSAGES +++++++++++ \n";

struct MessageLog {
    std::atomic<uint32_t> masks[8];
    std::mutex fileMutex;  // guards debugFileName and the appends, so lines never interleave
    std::string debugFileName;

    MessageLog() {
        for (auto &m : masks) m.store(kDefaultMask, std::memory_order_relaxed);
    }
};

MessageLog &log() {
    static MessageLog instance;
    return instance;
}

int clampLevel(int level) { return (level < 0 || level > 7) ? 7 : level; }

void dispatch(uint32_t type, const char *text) {
    // Compose the whole line first so that one write puts it out: lines from several
    // threads never interleave.
    std::string line;
    line.reserve(16 + std::char_traits<char>::length(text));
    line += messagePrefix(type);
    line += text;
    line += '\n';
    std::fwrite(line.data(), 1, line.size(), stdout);
    std::fflush(stdout);

    MessageLog &l = log();
    std::lock_guard<std::mutex> lock(l.fileMutex);
    if (l.debugFileName.empty()) return;
    if (FILE *f = std::fopen(l.debugFileName.c_str(), "a")) {
        std::fwrite(line.data(), 1, line.size(), f);
        std::fclose(f);
    }
}

}  // namespace

const char *messagePrefix(uint32_t type) {
    switch (type) {
        case kMsgDebug:
            return "[DEBUG]    ";
        case kMsgVerbose:
            return "[VERBOSE]  ";
        case kMsgProgress:
            return "[PROGRESS] ";
        case kMsgWarning:
            return "[WARNING]  ";
        case kMsgInfo:
            return "[INFO]     ";
        case kMsgBench:
            return "[BENCH]    ";
        case kMsgError:
            return "[ERROR]    ";
        default:
            return "[UNKNOWN]  ";
    }
}

bool isTypeEnabled(uint32_t type, int level) {
    return (log().masks[clampLevel(level)].load(std::memory_order_relaxed) & type) != 0;
}

void vmessage(uint32_t type, int level, const char *format, va_list args) {
    if (!isTypeEnabled(type, level)) return;
    char buffer[kMessageBufferSize];
    int n = std::vsnprintf(buffer, sizeof buffer, format ? format : "", args);
    if (n < 0) buffer[0] = '\0';  // an encoding error prints an empty text, never garbage
    dispatch(type, buffer);
}

void message(uint32_t type, int level, const char *format, ...) {
    va_list args;
    va_start(args, format);
    vmessage(type, level, format, args);
    va_end(args);
}

std::string formatText(const char *format, ...) {
    va_list args, again;
    va_start(args, format);
    va_copy(again, args);
    int n = std::vsnprintf(nullptr, 0, format, args);
    va_end(args);
    std::string text;
    if (n > 0) {
        text.resize(size_t(n));
        std::vsnprintf(text.data(), size_t(n) + 1, format, again);
    }
    va_end(again);
    return text;
}

void messageText(uint32_t type, int level, const std::string &text) {
    message(type, level, "%s", text.c_str());
}

void setTypeEnabled(uint32_t typeBits, bool on) {
    for (auto &m : log().masks) {
        if (on)
            m.fetch_or(typeBits, std::memory_order_relaxed);
        else
            m.fetch_and(~typeBits, std::memory_order_relaxed);
    }
}

void resetMessageFilters() {
    MessageLog &l = log();
    for (auto &m : l.masks) m.store(kDefaultMask, std::memory_order_relaxed);
    std::lock_guard<std::mutex> lock(l.fileMutex);
    l.debugFileName.clear();
}

bool setDebugFile(const std::string &name) {
    MessageLog &l = log();
    std::lock_guard<std::mutex> lock(l.fileMutex);
    l.debugFileName = name;
    if (name.empty()) return true;
    FILE *f = std::fopen(name.c_str(), "a");
    if (!f) {
        // A file that cannot be opened is forgotten, so later messages do not retry it.
        l.debugFileName.clear();
        return false;
    }
    std::fputs(kDebugBanner, f);
    std::fclose(f);
    return true;
}

void consoleLine(const std::string &text) {
    std::string line = text;
    line += '\n';
    std::fwrite(line.data(), 1, line.size(), stdout);
    std::fflush(stdout);
}

bool applyOutputVerbosity(const OutputVerbosityFlags &flags, const std::string &outputDirectory) {
    setTypeEnabled(kMsgError, flags.errorPrint);
    setTypeEnabled(kMsgWarning, flags.warningPrint);
    setTypeEnabled(kMsgDebug, flags.debugPrint);
    setTypeEnabled(kMsgVerbose, flags.verbosePrint);
    setTypeEnabled(kMsgProgress, flags.progressPrint);
    setTypeEnabled(kMsgBench, flags.benchmarkPrint);
    setTypeEnabled(kMsgInfo, flags.infoPrint);
    if (!flags.debugFile) return true;
    const std::string name = outputDirectory + "debug.out";
    if (setDebugFile(name)) return true;
    message(kMsgWarning, 6, "Unable to open the debug file %s", name.c_str());
    return false;
}

std::string debugFile() {
    MessageLog &l = log();
    std::lock_guard<std::mutex> lock(l.fileMutex);
    return l.debugFileName;
}

}  // namespace ox
