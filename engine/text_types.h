// The value types of the engine's own text spokes (CSV, JSON lines). Their
// usage codes are the letters of the nearest table type, so a layout moves
// between spokes by letter.
#pragma once

#include "host/zqdtype.h"

struct TextTypes {
  ZQDType text, memo, numeric, floating, date, boolean, integer, currency, dbl, datetime, binary;
  // NULL-ended list of all of them.
  const ZQDType* list[12];
  static const TextTypes& Get();
  // The type of a letter (C M N F D L I Y B T G); NULL for another letter.
  const ZQDType* ByLetter(char letter) const;
};
