#include "engine/read_fix.h"

#include <cstdlib>
#include <cstring>

#include "host/bytescan.h"
#include "host/zqglob.h"

TableReadFix::TableReadFix(ZQImport* source) {
  ZQString v;
  if (source->GetOption("version", v) != 0) return;  // no table
  if (source->GetOption("codepage", v) == 0) codepage_ = atoi(v.c_str());
  ZQRecord& layout = *source->GetLayout(0);
  for (int i = 0; i < layout.FieldCount(); ++i) {
    char letter = char(layout[i]->DataType().Usage());
    if (letter == 'C') text_.push_back(i);
    else if (letter == 'M' && codepage_ != 0) memos_.push_back(i);
  }
}

void TableReadFix::Mend(ZQRecord& record) {
  for (int i : text_) {
    ZQField* f = record[i];
    if (f->held() != ZQField::Held::kText) continue;
    const ZQString& s = f->StringRef();
    int32_t n = s.length();
    if (n == 0 || s.c_str()[n - 1] != '\0') continue;
    // NULs and blanks at the end are padding, whatever their order.
    while (n > 0 && (s.c_str()[n - 1] == '\0' || s.c_str()[n - 1] == ' ')) --n;
    if (n == 0) f->Blank();
    else f->AssignText(s.c_str(), n);
  }
  for (int i : memos_) {
    ZQField* f = record[i];
    if (f->held() != ZQField::Held::kText) continue;
    const ZQString& s = f->StringRef();
    // A memo holding NUL bytes is no text (an image, a document): its bytes
    // stay as they are.
    if (!bytescan::HasHighBit(s.c_str(), size_t(s.length())) || memchr(s.c_str(), 0, size_t(s.length())) != nullptr)
      continue;
    scratch_ = s;
    ZQGlob::ExternalToInternal(codepage_, scratch_);
    f->AssignText(scratch_.c_str(), scratch_.length());
  }
}
