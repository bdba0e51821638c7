#include "engine/text_types.h"

namespace {
void Init(TextTypes& t) {
  t.text.Define("Text;alias=Character;usage=0x43");
  t.memo.Define("Memo;alias=Memo;usage=0x4d");
  t.numeric.Define("dBASE Numeric;alias=Numeric;decsep=.;usage=0x4e");
  t.floating.Define("dBASE Numeric;alias=Float;decsep=.;usage=0x46");
  t.date.Define("Date;usage=0x44;picture=yyyymmdd");
  t.boolean.Define("Boolean;alias=Logical;usage=0x4c;picture=T.F");
  t.integer.Define("Integer;usage=0x49");
  t.currency.Define("Float;alias=Currency;currency;decsep=.;usage=0x59");
  t.dbl.Define("Float;alias=Double;decsep=.;usage=0x42");
  t.datetime.Define("DateTime;usage=0x54");
  t.binary.Define("Binary;alias=Ole;usage=0x47");
  const ZQDType* all[] = {&t.text,    &t.memo,    &t.numeric, &t.floating, &t.date,  &t.boolean,
                          &t.integer, &t.currency, &t.dbl,    &t.datetime, &t.binary};
  for (int i = 0; i < 11; ++i) t.list[i] = all[i];
  t.list[11] = nullptr;
}
}  // namespace

const TextTypes& TextTypes::Get() {
  // Built in place: the list points at the members.
  static TextTypes types;
  static const bool ready = (Init(types), true);
  (void)ready;
  return types;
}

const ZQDType* TextTypes::ByLetter(char letter) const {
  for (int i = 0; list[i] != nullptr; ++i)
  if (list[i]->Usage() == letter) return list[i];
  return nullptr;
}
