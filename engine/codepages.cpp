#include "engine/codepages.h"

#include <cctype>
#include <cstdio>
#include <cstdlib>

#include "engine/report.h"
#include "engine/text_util.h"
#include "host/zqglob.h"

namespace {

// Language driver bytes and their code pages (the single-byte ones; the
// drivers of the Asian double-byte code pages name code pages the host
// can't convert, and are reported as such).
struct Driver {
  uint8_t byte;
  int codepage;
};
const Driver kDrivers[] = {
    {0x01, 437},  {0x02, 850},  {0x03, 1252}, {0x04, 10000}, {0x08, 865},  {0x09, 437},  {0x0A, 850},
    {0x0B, 437},  {0x0D, 437},  {0x0E, 850},  {0x0F, 437},   {0x10, 850},  {0x11, 437},  {0x12, 850},
    {0x13, 932},  {0x14, 850},  {0x15, 437},  {0x16, 850},   {0x17, 865},  {0x18, 437},  {0x19, 437},
    {0x1A, 850},  {0x1B, 437},  {0x1C, 863},  {0x1D, 850},   {0x1F, 852},  {0x22, 852},  {0x23, 852},
    {0x24, 860},  {0x25, 850},  {0x26, 866},  {0x37, 850},   {0x40, 852},  {0x4D, 936},  {0x4E, 949},
    {0x4F, 950},  {0x50, 874},  {0x57, 1252}, {0x58, 1252},  {0x59, 1252}, {0x64, 852},  {0x65, 866},
    {0x66, 865},  {0x67, 861},  {0x6A, 737},  {0x6B, 857},   {0x6C, 863},  {0x78, 950},  {0x79, 949},
    {0x7A, 936},  {0x7B, 932},  {0x7C, 874},  {0x7D, 1255},  {0x7E, 1256}, {0x86, 737},  {0x87, 852},
    {0x88, 857},  {0x96, 10007}, {0x97, 10029}, {0x98, 10006}, {0xC8, 1250}, {0xC9, 1251}, {0xCA, 1254},
    {0xCB, 1253}, {0xCC, 1257},
};

bool Supported(int codepage) { return codepage == kUtf8CodePage || ZQGlob::CodePageSupported(codepage); }

std::string Trim(const std::string& s) {
  size_t a = 0, b = s.size();
  while (a < b && isspace(static_cast<unsigned char>(s[a]))) ++a;
  while (b > a && isspace(static_cast<unsigned char>(s[b - 1]))) --b;
  return s.substr(a, b - a);
}

}  // namespace

int CodePageOfDriver(uint8_t driver) {
  for (const Driver& d : kDrivers)
    if (d.byte == driver) return d.codepage;
  return 0;
}

bool ParseCodePage(const std::string& name, int* out) {
  std::string v = Lower(Trim(name));
  if (v == "utf-8" || v == "utf8") return *out = kUtf8CodePage, true;
  // A prefix that names the family, then the number.
  for (const char* prefix : {"windows-", "windows", "cp-", "cp", "ibm-", "ibm", "ansi ", "oem ", "dos-", "dos"}) {
    std::string p = prefix;
    if (v.compare(0, p.size(), p) == 0 && v.size() > p.size() && isdigit(static_cast<unsigned char>(v[p.size()]))) {
      v = v.substr(p.size());
      break;
    }
  }
  if (v.empty() || v.size() > 5) return false;
  for (char c : v)
    if (!isdigit(static_cast<unsigned char>(c))) return false;
  int cp = atoi(v.c_str());
  if (!Supported(cp)) return false;
  *out = cp;
  return true;
}

std::string AcceptedCodePages() {
  return "a number such as 437, 850, 852, 866, 1250-1258, or cpNNN, windows-NNNN, utf-8 (65001); 0 passes bytes "
         "as they are";
}

std::string CpgPath(const std::string& table_path) {
  std::string base = table_path;
  size_t dot = base.rfind('.');
  if (dot != std::string::npos && base.find('/', dot) == std::string::npos) base.resize(dot);
  return base + ".cpg";
}

CodePageChoice ChooseCodePage(const std::string& path, int given) {
  CodePageChoice c;
  unsigned char h[32];
  FILE* f = fopen(path.c_str(), "rb");
  size_t got = f ? fread(h, 1, sizeof h, f) : 0;
  if (f) fclose(f);
  // The narrow headers of dBASE II and Enable (0x02, 0xFE) have no driver byte.
  if (got == sizeof h && h[0] != 0x02 && h[0] != 0xFE) c.driver = h[29];
  if (given != kCodePageUnset) {
    c.codepage = given;
    c.origin = "--codepage";
    return c;
  }
  if (c.driver > 0) {
    int cp = CodePageOfDriver(uint8_t(c.driver));
    char hex[16];
    snprintf(hex, sizeof hex, "0x%02X", unsigned(c.driver));
    if (cp != 0 && Supported(cp)) {
      c.codepage = cp;
      c.origin = std::string("the language driver ") + hex;
      return c;
    }
    Warn(path + ": the language driver " + hex +
         (cp != 0 ? " names code page " + std::to_string(cp) + ", which zqdb can't convert"
                  : " names no code page zqdb knows") +
         ": its text is passed as it is (--codepage chooses one)");
  }
  const std::string lower = CpgPath(path);
  for (const std::string& cpg : {lower, lower.substr(0, lower.size() - 3) + "CPG"}) {
    FILE* g = fopen(cpg.c_str(), "rb");
    if (g == nullptr) continue;
    char buf[64] = {};
    size_t n = fread(buf, 1, sizeof buf - 1, g);
    fclose(g);
    std::string text(buf, n);
    int cp = 0;
    if (ParseCodePage(text, &cp)) {
      c.codepage = cp;
      c.origin = cpg;
    } else {
      Warn(cpg + " names no code page zqdb can convert (\"" + Trim(text) +
           "\"): the table's text is passed as it is (--codepage chooses one)");
    }
    return c;
  }
  return c;
}

bool WriteCpg(const std::string& table_path, int codepage, std::string* error) {
  std::string path = CpgPath(table_path);
  FILE* f = fopen(path.c_str(), "wb");
  bool ok = f != nullptr;
  // The way other programs write them: "UTF-8", or the code page's number.
  if (ok) ok = fputs(codepage == kUtf8CodePage ? "UTF-8" : std::to_string(codepage).c_str(), f) >= 0;
  if (f != nullptr && fclose(f) != 0) ok = false;
  if (!ok) *error = "cannot write " + path;
  return ok;
}
