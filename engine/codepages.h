// The code page of a table's text: named by the user, or found by zqdb from
// the table's language driver byte or a .cpg file beside it; and the .cpg
// file zqdb writes beside the tables it makes, so that other programs know
// the code page too.
#pragma once

#include <cstdint>
#include <string>

// UTF-8 as a code page number: the text is stored as zqdb holds it, so the
// module is given 0 (bytes as they are) for it.
constexpr int kUtf8CodePage = 65001;
// A code page option not given: chosen by the file.
constexpr int kCodePageUnset = -1;

// What the module is given for a code page.
inline int ModuleCodePage(int codepage) { return codepage == kUtf8CodePage || codepage < 0 ? 0 : codepage; }

// The code page of a language driver byte (offset 29 of the header), or 0
// for a byte that names none zqdb knows.
int CodePageOfDriver(uint8_t driver);

// A code page by the names people give it: "850", "cp850", "CP850",
// "IBM850", "1252", "windows-1252", "ANSI 1252", "utf-8", "65001", "0".
// False for a name that isn't one, or a code page the host can't convert.
bool ParseCodePage(const std::string& name, int* out);
// The names ParseCodePage accepts, for the error of an unknown one.
std::string AcceptedCodePages();

// How the code page of a table was chosen.
struct CodePageChoice {
  int codepage = 0;    // 0: bytes as they are
  int driver = -1;     // the language driver byte; -1: the header has none
  std::string origin;  // "--codepage", "the language driver", the .cpg path, or "" (none)
};

// The code page to read the table `path` with: `given` unless it is
// kCodePageUnset, else the one its language driver byte names, else the one
// of a .cpg file beside it, else 0. A byte or file that names a code page the
// host can't convert is passed over with a warning.
CodePageChoice ChooseCodePage(const std::string& path, int given);

// The .cpg file of a table: its name with the extension .cpg.
std::string CpgPath(const std::string& table_path);
// Writes the .cpg file of the table `table_path` naming `codepage`. False
// with `error` set.
bool WriteCpg(const std::string& table_path, int codepage, std::string* error);
