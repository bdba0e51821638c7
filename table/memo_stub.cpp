// Placeholder memo engine until the memo reader lands: no memo file opens.
#include <cstdio>
#include <cstdlib>

#include "table/memo.h"

int openmemo(const char*, ZQDBFILE*, bool) { return -1; }

bool getmemo(ZQDBFILE*, uint32_t block, uint32_t, ZQString& text) {
  text = "";
  return block == 0;
}

ZQMemoBlockNumber::~ZQMemoBlockNumber() = default;

uint32_t ZQMemoBlockNumber::StringtoNumber(const ZQString& text) {
  if (text == blank_memo_str) return 0;
  return uint32_t(strtoul(text.c_str(), nullptr, 10));
}

char* ZQMemoBlockNumber::NumbertoBuf(char* buffer, uint32_t block) {
  snprintf(buffer, 11, "%010lu", static_cast<unsigned long>(block));
  return buffer;
}
