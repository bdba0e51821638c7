// Where a conversion writes: the target the user named, checked and
// resolved before anything is written. "-" is standard output (CSV and JSON
// lines); a symbolic link is written through, never replaced; a device, FIFO
// or socket takes CSV and JSON lines as they are written but no table; a
// directory takes nothing.
#pragma once

#include <string>

// Resolves `path` for a target of that kind (`table`: a table, else a text
// file): `out` is the file to write, the link's target for a symbolic link.
// False with `error` set when the target can't take it.
bool ResolveTargetPath(const std::string& path, bool table, std::string* out, std::string* error);

// True for a file name ending that names a format zqdb doesn't write (.tsv,
// .txt, spreadsheets), which must not be taken for a table's name.
bool IsForeignTargetName(const std::string& path);
