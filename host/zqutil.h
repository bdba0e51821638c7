// Free functions of the host's utility library, and the log sink.
#pragma once

#include <cstdarg>
#include <cstdint>

#include "host/zqstring.h"
#include "host/zqtypes.h"

// The translation of a message; this host has no catalogue, so the message
// itself.
const wchar* lgettext(const wchar* message);

// Longest keyword NextKeyword stores, its NUL included; longer ones are cut.
constexpr int kKeywordSize = 64;
// Takes the next non-empty line of the form "keyword= value" off `text`. The
// keyword goes to `keyword` (kKeywordSize bytes), the value, blanks around it
// removed, waits in `text` for ZQString::Extract. False at the end.
bool NextKeyword(char* keyword, ZQString& text);

// 32-bit and 16-bit little-endian numbers at *p; *p moves behind them.
int32_t str_long(char** p);
int16_t str_short(char** p);
// Writes `v` as 4 little-endian bytes; the result points behind them.
char* stw_long(char* buffer, int32_t v);
int strcmpi(const char* a, const char* b);

// Renders a wide printf-style format as UTF-8 into `out`. As in wide printf
// formats, %s takes a wide string and %S (or %hs) an 8-bit one; %d and %ld
// take a 32-bit number, %lld a 64-bit one; positional forms (%1$s) work too.
void FormatMessageV(ZQString& out, const wchar* format, va_list args);
void FormatMessage(ZQString& out, const wchar* format, ...);

// Where logged messages go. The engine prints them; tests capture them.
using ZQLogSink = void (*)(void* context, int level, BATCHERR code, const char* message);
void SetLogSink(ZQLogSink sink, void* context);
void EmitLog(int level, BATCHERR code, const char* message);

// The console: the few diagnostic lines a module prints for the person at the
// terminal. Standard output unless the engine sends them elsewhere (zqdb sends
// them to standard error, so that they never mix with data on standard output).
using ZQConsoleSink = void (*)(const char* text);
void SetConsoleSink(ZQConsoleSink sink);
// Prints a printf-style narrow format on the console.
void ConsolePrintf(const char* format, ...) __attribute__((format(printf, 1, 2)));
