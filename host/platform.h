// The runtime names the module calls, mapped onto POSIX.
//
// `_open` flags follow the runtime's values: 0x0002 read-write, 0x0100
// create, 0x0200 truncate, 0x8000 binary (no effect here). The module uses
// 0x8002 (read-write, binary) and 0x8302 (read-write, create, truncate,
// binary). Offsets are the runtime's 32-bit `long`.
#pragma once

#include <cstdint>
#include <cstdio>
#include <ctime>

constexpr int kRtReadOnly = 0x0000;
constexpr int kRtWriteOnly = 0x0001;
constexpr int kRtReadWrite = 0x0002;
constexpr int kRtCreate = 0x0100;
constexpr int kRtTruncate = 0x0200;
constexpr int kRtExclusive = 0x0400;
constexpr int kRtBinary = 0x8000;

int _open(const char* path, int flags, int mode = 0644);
int _close(int fd);
int32_t _lseek(int fd, int32_t offset, int whence);
int32_t _read(int fd, void* buffer, uint32_t count);
int32_t _write(int fd, const void* buffer, uint32_t count);
// mode 0 exists, 2 writable, 4 readable, 6 both; 0 or -1.
int _access(const char* path, int mode);
int _unlink(const char* path);
// Opens a stdio stream; the share flag has no meaning here.
FILE* _fsopen(const char* path, const char* mode, int shflag);
int64_t _time64(int64_t* out);
// Local time of `*t`; NULL when it can't be represented. The result lives in
// a static buffer, as the runtime's does.
struct tm* _localtime64(const int64_t* t);
