#pragma once

#include <cstdarg>
#include <cstdint>
#include <string>

/// The one message function of the system, its types and filters.
namespace ox {

/// Message types; the numbers are bit values and are what callers pass.
enum MessageType : uint32_t {
    kMsgDebug = 1,
    kMsgVerbose = 2,
    kMsgProgress = 4,
    kMsgWarning = 8,
    kMsgInfo = 16,
    kMsgBench = 32,
    kMsgError = 64,
};

/// Size of the formatting buffer, terminator included; longer texts are cut.
constexpr size_t kMessageBufferSize = 4096;

/// printf-style message of a type at a level (0 to 7; others are treated as 7).
void message(uint32_t type, int level, const char *format, ...)
    __attribute__((format(printf, 3, 4)));
/// The same with a va_list.
void vmessage(uint32_t type, int level, const char *format, va_list args);
/// Prints a text composed from input as it stands (never used as a format).
void messageText(uint32_t type, int level, const std::string &text);
/// printf-style formatting into a string of whatever length the text needs.
std::string formatText(const char *format, ...) __attribute__((format(printf, 1, 2)));

/// The 11-character console prefix of a type ("[UNKNOWN]  " for a value not in the table).
const char *messagePrefix(uint32_t type);

/// Sets or clears the type bits in all eight level masks.
void setTypeEnabled(uint32_t typeBits, bool on);
/// True when a message of this type at this level would be shown.
bool isTypeEnabled(uint32_t type, int level = 6);
/// Restores the masks of a new process and forgets the debug file (for tests and new runs).
void resetMessageFilters();

/// Sets the debug file: appends the banner line now and every later message to it.
/// An empty name stops the copying. Returns false when the file cannot be opened.
bool setDebugFile(const std::string &name);
/// The current debug file name (empty = none).
std::string debugFile();

/// Writes one line to standard output as it stands: no prefix, no filter, no debug file. Used
/// for the command line's syntax lines, which are printed before any filter exists.
void consoleLine(const std::string &text);

/// The switches of the OutputVerbosity settings, one per message type, plus the debug file flag.
/// The defaults are those of a new process.
struct OutputVerbosityFlags {
    bool errorPrint = true;       ///< messages of type kMsgError
    bool warningPrint = true;     ///< messages of type kMsgWarning
    bool debugPrint = false;      ///< messages of type kMsgDebug
    bool verbosePrint = false;    ///< messages of type kMsgVerbose
    bool progressPrint = true;    ///< messages of type kMsgProgress
    bool benchmarkPrint = false;  ///< messages of type kMsgBench
    bool infoPrint = true;        ///< messages of type kMsgInfo
    bool debugFile = false;       ///< also append every message to "debug.out"
};

/// Switches the seven types on or off (error, warning, debug, verbose, progress, benchmark, info,
/// in that order); with debugFile, copies messages to outputDirectory + "debug.out" from now on.
/// outputDirectory is used as given (it ends in "/" or is empty). Returns false only when the
/// debug file cannot be opened (reported as a warning).
bool applyOutputVerbosity(const OutputVerbosityFlags &flags, const std::string &outputDirectory);

}  // namespace ox
