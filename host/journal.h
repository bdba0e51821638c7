// The undo journal: while it is open, every write that the table, memo and
// index files get through this layer is preceded by a copy of the bytes it
// overwrites, kept in a journal file, and every file's length and existence
// at its first open is written there first. Restoring puts the copies back
// and cuts each file to its old length, so a run that fails (a full disk, an
// I/O error) or is killed leaves the files as they were before it.
//
// Journal file: "ZQDBJRN1", then records, all integers little-endian:
//   'F' u32 file number, i64 length (-1: the file didn't exist), u32 n, path[n]
//   'P' u32 file number, i64 offset, u32 n, bytes[n]   (bytes before the run)
// A record cut short by a kill is ignored: the write it guarded never began.
// One thread at a time.
#pragma once

#include <cstdint>
#include <string>

namespace journal {

// Opens a journal at `path` (it must not exist). False with errno set.
bool Begin(const std::string& path);
bool Active();
// Called by the platform layer when `path` is opened as `fd` for writing,
// before anything is written; `truncating` when the open is about to cut the
// file (its bytes are kept first). Called before the open itself. False when
// the journal can't be written (the open must then fail).
bool BeforeOpen(const char* path, bool truncating);
void Opened(int fd);
void Closed(int fd);
// Called before [offset, offset + count) of `fd` is written. False when the
// old bytes couldn't be kept (the write must not happen), errno set.
bool BeforeWrite(int fd, int64_t offset, int64_t count);
// Ends the journal: the run is kept, the journal removed.
void Commit();
// Puts back what the journal at `path` holds and removes it. False with
// `error` set when a file couldn't be restored (the journal then stays).
bool Restore(const std::string& path, std::string* error);
// Restores the open journal (after the files were closed).
bool RestoreActive(std::string* error);

// The errno of the last failed write of any file of this layer, 0 if none.
int LastWriteError();
// The path of the file whose write failed last, "" when unknown.
const char* LastWriteFile();
// Notes a failed write of `fd` (-1 when no file is known).
void NoteWriteError(int error, int fd = -1);

}  // namespace journal
