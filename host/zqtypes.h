// Fixed-width names for the numbers the connector interface is written in.
// The interface's "long" is 32 bits, "short" 16, "long long" 64 and "wchar"
// a 16-bit character on every platform, so every signature and on-disk number
// uses these aliases rather than the platform's own types.
#pragma once

#include <cstddef>
#include <cstdint>

using wchar = char16_t;

// Result of almost every connector operation; 0 is success.
using BATCHERR = int32_t;

enum : BATCHERR {
  ZQ_OK = 0,
  ZQ_END = 1,
  ZQ_NO_FILENAME = 2,
  ZQ_READ_ERROR = 4,
  ZQ_NO_MEMORY = 5,
  ZQ_CREATE_ERROR = 7,
  ZQ_WRITE_ERROR = 8,
  ZQ_RECORD_TOO_LONG = 11,
  ZQ_NOT_OPEN = 12,
  ZQ_BAD_OPTIONS = 13,
  ZQ_LAYOUT_DIFFERS = 15,
  ZQ_INDEX_ERROR = 17,
  ZQ_OPEN_ERROR = 19,
  ZQ_MEMO_OPEN_ERROR = 36,
  ZQ_NOT_SUPPORTED = 45,
};

// Kind of a binary ZQDType: 0 text, 1 16-bit integer, 2 32-bit integer,
// 3 8-byte IEEE double.
enum DATATYPE : int32_t {
  DT_TEXT = 0,
  DT_SHORT = 1,
  DT_LONG = 2,
  DT_DOUBLE = 3,
};

// Family of a field's value. 1 to 4 are numeric (3 the plain numeric field),
// 6 and 8 dates, 9 boolean.
enum FIELDTYPE : int32_t {
  FT_TEXT = 0,
  FT_INTEGER = 1,
  FT_FLOAT = 2,
  FT_NUMERIC = 3,
  FT_CURRENCY = 4,
  FT_BINARY = 5,
  FT_DATE = 6,
  FT_TIME = 7,
  FT_DATETIME = 8,
  FT_BOOLEAN = 9,
};

// Marks an option block by the connector that made it; 4 is this connector.
using SPOKETYPE = int32_t;
constexpr SPOKETYPE kSpokeTypeDbase = 4;

// Character set of a file name or text handed to the host; the connector
// always passes 0 (bytes as they are).
using ZQ_CSET = int32_t;

// Warn levels of the host's truncation checks; the connector never consults them.
using ZQ_WARN_LEVEL = int32_t;
