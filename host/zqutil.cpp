#include "host/zqutil.h"

#include <strings.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "host/endian.h"

const wchar* lgettext(const wchar* message) { return message; }

bool NextKeyword(char* keyword, ZQString& text) {
  for (;;) {
    int32_t n = text.length();
    if (n == 0) return false;
    const char* s = text.c_str();
    int32_t end = 0;
    while (end < n && s[end] != '\n') ++end;
    int32_t line_len = end;
    while (line_len > 0 && (s[line_len - 1] == '\r' || s[line_len - 1] == ' ')) --line_len;
    int32_t eq = 0;
    while (eq < line_len && s[eq] != '=') ++eq;
    bool blank = true;
    for (int32_t i = 0; i < line_len; ++i)
      if (s[i] != ' ' && s[i] != '\t') blank = false;
    if (!blank) {
      int32_t k = eq;
      while (k > 0 && s[k - 1] == ' ') --k;
      int32_t take = k < kKeywordSize - 1 ? k : kKeywordSize - 1;
      memcpy(keyword, s, size_t(take));
      keyword[take] = '\0';
      int32_t v = eq < line_len ? eq + 1 : line_len;
      while (v < line_len && s[v] == ' ') ++v;
      free(text.pending_);
      text.pending_ = static_cast<char*>(malloc(size_t(line_len - v) + 1));
      if (text.pending_ != nullptr) {
        memcpy(text.pending_, s + v, size_t(line_len - v));
        text.pending_[line_len - v] = '\0';
      }
    }
    text.Remove(end < n ? end + 1 : end, 0);
    if (!blank) return true;
  }
}

int32_t str_long(char** p) {
  int32_t v = int32_t(GetLe32(reinterpret_cast<const uint8_t*>(*p)));
  *p += 4;
  return v;
}

int16_t str_short(char** p) {
  int16_t v = int16_t(GetLe16(reinterpret_cast<const uint8_t*>(*p)));
  *p += 2;
  return v;
}

char* stw_long(char* buffer, int32_t v) {
  PutLe32(reinterpret_cast<uint8_t*>(buffer), uint32_t(v));
  return buffer + 4;
}

int strcmpi(const char* a, const char* b) { return strcasecmp(a ? a : "", b ? b : ""); }

// ---------------------------------------------------------------------------
// Message formatting.

namespace {

constexpr int kMaxArgs = 16;

enum class ArgKind : uint8_t { kNone, kInt, kInt64, kDouble, kStr, kWStr, kChar };

struct Conversion {
  int pos;  // argument index from 0
  char flags[8];
  int width;      // -1 none
  int precision;  // -1 none
  int longs;      // count of 'l'
  int shorts;     // count of 'h'
  char conv;
};

void AppendWide(ZQString& out, const wchar* w) {
  if (w == nullptr) {
    out += "(null)";
    return;
  }
  for (; *w; ++w) {
    uint32_t c = *w;
    if (c >= 0xD800 && c < 0xDC00 && w[1] >= 0xDC00 && w[1] < 0xE000) {
      c = 0x10000 + ((c - 0xD800) << 10) + (uint32_t(w[1]) - 0xDC00);
      ++w;
    }
    char b[4];
    int n;
    if (c < 0x80) b[0] = char(c), n = 1;
    else if (c < 0x800) b[0] = char(0xC0 | c >> 6), b[1] = char(0x80 | (c & 0x3F)), n = 2;
    else if (c < 0x10000)
      b[0] = char(0xE0 | c >> 12), b[1] = char(0x80 | (c >> 6 & 0x3F)), b[2] = char(0x80 | (c & 0x3F)), n = 3;
    else
      b[0] = char(0xF0 | c >> 18), b[1] = char(0x80 | (c >> 12 & 0x3F)), b[2] = char(0x80 | (c >> 6 & 0x3F)),
      b[3] = char(0x80 | (c & 0x3F)), n = 4;
    out.Append(b, n);
  }
}

ArgKind KindOf(const Conversion& s) {
  switch (s.conv) {
    case 'd': case 'i': case 'u': case 'x': case 'X': case 'o':
      return s.longs >= 2 ? ArgKind::kInt64 : ArgKind::kInt;
    case 'f': case 'g': case 'e': case 'G': case 'E': return ArgKind::kDouble;
    // Wide-format convention: %s is a wide string, %S (and %hs) an 8-bit one.
    case 's': return s.shorts ? ArgKind::kStr : ArgKind::kWStr;
    case 'S': return s.longs ? ArgKind::kWStr : ArgKind::kStr;
    case 'c': return ArgKind::kChar;
    default: return ArgKind::kNone;
  }
}

// Parses the conversion at format[i] (just behind '%'); false if malformed.
bool ParseConversion(const wchar* f, size_t& i, int& next_pos, Conversion& s) {
  s = Conversion{next_pos, {0}, -1, -1, 0, 0, 0};
  size_t save = i;
  int num = 0;
  bool digits = false;
  while (f[i] >= '0' && f[i] <= '9') num = num * 10 + (f[i++] - '0'), digits = true;
  if (digits && f[i] == '$' && num >= 1 && num <= kMaxArgs) {
    s.pos = num - 1;
    ++i;
  } else {
    i = save;
    s.pos = next_pos++;
  }
  int nf = 0;
  while ((f[i] == '-' || f[i] == '+' || f[i] == ' ' || f[i] == '0' || f[i] == '#') && nf < 6)
    s.flags[nf++] = char(f[i++]);
  if (f[i] >= '0' && f[i] <= '9') {
    s.width = 0;
    while (f[i] >= '0' && f[i] <= '9' && s.width < 1000) s.width = s.width * 10 + (f[i++] - '0');
  }
  if (f[i] == '.') {
    ++i;
    s.precision = 0;
    while (f[i] >= '0' && f[i] <= '9' && s.precision < 1000) s.precision = s.precision * 10 + (f[i++] - '0');
  }
  while (f[i] == 'l' || f[i] == 'h' || f[i] == 'I') {
    if (f[i] == 'l') ++s.longs;
    if (f[i] == 'h') ++s.shorts;
    ++i;
  }
  if (f[i] == 0) return false;
  s.conv = char(f[i++]);
  return s.pos < kMaxArgs && KindOf(s) != ArgKind::kNone;
}

}  // namespace

void FormatMessageV(ZQString& out, const wchar* format, va_list args) {
  out = "";
  if (format == nullptr) return;
  // First pass: the kind of every argument, so that positional forms can
  // fetch them in order from the va_list.
  ArgKind kinds[kMaxArgs] = {};
  int next = 0, max_pos = -1;
  for (size_t i = 0; format[i];) {
    if (format[i++] != '%') continue;
    if (format[i] == '%') {
      ++i;
      continue;
    }
    Conversion s;
    if (!ParseConversion(format, i, next, s)) break;
    kinds[s.pos] = KindOf(s);
    if (s.pos > max_pos) max_pos = s.pos;
  }
  union Arg {
    int32_t i;
    int64_t l;
    double d;
    const char* s;
    const wchar* w;
  } vals[kMaxArgs] = {};
  for (int k = 0; k <= max_pos; ++k) {
    switch (kinds[k]) {
      case ArgKind::kInt: case ArgKind::kChar: vals[k].i = va_arg(args, int32_t); break;
      case ArgKind::kInt64: vals[k].l = va_arg(args, int64_t); break;
      case ArgKind::kDouble: vals[k].d = va_arg(args, double); break;
      case ArgKind::kStr: vals[k].s = va_arg(args, const char*); break;
      case ArgKind::kWStr: vals[k].w = va_arg(args, const wchar*); break;
      case ArgKind::kNone: k = max_pos; break;  // a gap: stop fetching
    }
  }
  next = 0;
  for (size_t i = 0; format[i];) {
    wchar c = format[i++];
    if (c != '%') {
      // A surrogate pair goes out whole, as one 4-byte UTF-8 character.
      wchar one[3] = {c, 0, 0};
      if (c >= 0xD800 && c < 0xDC00 && format[i] >= 0xDC00 && format[i] < 0xE000) one[1] = format[i++];
      AppendWide(out, one);
      continue;
    }
    if (format[i] == '%') {
      out += '%';
      ++i;
      continue;
    }
    size_t start = i;
    Conversion s;
    if (!ParseConversion(format, i, next, s)) {
      out += '%';
      i = start;
      continue;
    }
    char fmt[32];
    int w = s.width, p = s.precision;
    char buf[128];
    const Arg& a = vals[s.pos];
    switch (KindOf(s)) {
      case ArgKind::kInt:
        snprintf(fmt, sizeof fmt, "%%%s%s%s%c", s.flags, w >= 0 ? "*" : "", p >= 0 ? ".*" : "", s.conv);
        if (w >= 0 && p >= 0) snprintf(buf, sizeof buf, fmt, w, p, a.i);
        else if (w >= 0) snprintf(buf, sizeof buf, fmt, w, a.i);
        else if (p >= 0) snprintf(buf, sizeof buf, fmt, p, a.i);
        else snprintf(buf, sizeof buf, fmt, a.i);
        out += buf;
        break;
      case ArgKind::kInt64:
        snprintf(fmt, sizeof fmt, "%%%s%sll%c", s.flags, w >= 0 ? "*" : "", s.conv);
        if (w >= 0) snprintf(buf, sizeof buf, fmt, w, static_cast<long long>(a.l));
        else snprintf(buf, sizeof buf, fmt, static_cast<long long>(a.l));
        out += buf;
        break;
      case ArgKind::kDouble:
        snprintf(fmt, sizeof fmt, "%%%s%s%c", s.flags, p >= 0 ? ".*" : "", s.conv);
        if (p >= 0) snprintf(buf, sizeof buf, fmt, p, a.d);
        else snprintf(buf, sizeof buf, fmt, a.d);
        out += buf;
        break;
      case ArgKind::kChar: out += char(a.i); break;
      case ArgKind::kStr: out += a.s ? a.s : "(null)"; break;
      case ArgKind::kWStr: AppendWide(out, a.w); break;
      case ArgKind::kNone: break;
    }
  }
}

void FormatMessage(ZQString& out, const wchar* format, ...) {
  va_list ap;
  va_start(ap, format);
  FormatMessageV(out, format, ap);
  va_end(ap);
}

namespace {
ZQLogSink g_sink = nullptr;
void* g_sink_context = nullptr;
}  // namespace

void SetLogSink(ZQLogSink sink, void* context) {
  g_sink = sink;
  g_sink_context = context;
}

void EmitLog(int level, BATCHERR code, const char* message) {
  if (g_sink != nullptr) g_sink(g_sink_context, level, code, message);
  else fprintf(stderr, "%s\n", message);
}

namespace {
ZQConsoleSink console_sink = nullptr;
}

void SetConsoleSink(ZQConsoleSink sink) { console_sink = sink; }

void ConsolePrintf(const char* format, ...) {
  char line[1024];
  va_list args;
  va_start(args, format);
  vsnprintf(line, sizeof line, format, args);
  va_end(args);
  if (console_sink != nullptr) {
    console_sink(line);
  } else {
    fputs(line, stdout);
    fflush(stdout);
  }
}
