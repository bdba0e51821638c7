// The dialect options: names and numbers, the saved text form, the order
// number, the option lists, and the exchange of option blocks.
#include <gtest/gtest.h>

#include <memory>
#include <string>

#include "tests/support/dbase_peer.h"
#include "tests/support/read_harness.h"

namespace {

std::string Text(const ZQString& s) { return std::string(s.c_str(), size_t(s.length())); }

std::string Saved(ZQFromDbase* spoke) {
  ZQString text;
  spoke->SaveOptions(text);
  return Text(text);
}

void Load(ZQFromDbase* spoke, const char* text) {
  ZQString t(text);
  spoke->LoadOptions(t);
}

int Version(ZQFromDbase* spoke) {
  ZQString v;
  EXPECT_EQ(spoke->GetOption("version", v), 0);
  return atoi(v.c_str());
}

ZQDbaseOptions& Block(ZQFromDbase* spoke) { return *static_cast<ZQDbaseOptions*>(spoke->GetOptions()); }

// Loads `text` and gives the dialect it leaves.
int Loaded(ZQFromDbase* spoke, const char* text) {
  Load(spoke, text);
  return Version(spoke);
}

TEST(OptionsTest, DialectByNameInAnyCaseOrByNumber) {
  tests::Source s(6);
  EXPECT_EQ(Version(s.spoke()), 6);
  EXPECT_EQ(Loaded(s.spoke(), "version= dBase iv\n"), 2);
  EXPECT_EQ(Loaded(s.spoke(), "version= 10\n"), 10);
  EXPECT_EQ(Loaded(s.spoke(), "VERSION= 2\n"), 2);
  // Other products' names load their dialect; saving writes the dialect's name.
  EXPECT_EQ(Loaded(s.spoke(), "version= Telemagic (FoxPro)\n"), 6);
  EXPECT_EQ(Saved(s.spoke()), "version= FoxPro\n");
  EXPECT_EQ(Loaded(s.spoke(), "version= alpha four\n"), 1);
  EXPECT_EQ(Saved(s.spoke()), "version= dBASE III+\n");
  Load(s.spoke(), "version= ACT! for Windows\n");
  EXPECT_EQ(Saved(s.spoke()), "version= dBASE III\n");
  Load(s.spoke(), "version= Action Plus (dBASE II)\n");
  EXPECT_EQ(Saved(s.spoke()), "version= dBASE II\n");

  // Nothing fits: unknown names, numbers without a row, other keywords.
  EXPECT_EQ(Loaded(s.spoke(), "version= dBASE V\nversion= 5\nversion= 11\nversion= -1\ncolour= blue\n"), 0);

  // Dialect 5 is taken by the option, and has no name to save.
  EXPECT_EQ(s->SetOption("version", "5"), 0);
  EXPECT_EQ(Version(s.spoke()), 5);
  EXPECT_EQ(Saved(s.spoke()), "");
  // Out of range, or not a number (0): the dialect set through the option.
  EXPECT_EQ(s->SetOption("version", "12"), 0);
  EXPECT_EQ(Version(s.spoke()), 5);
  EXPECT_EQ(s->SetOption("version", "dBASE IV"), 0);
  EXPECT_EQ(Version(s.spoke()), 0);
}

TEST(OptionsTest, SavedTextForEachNamedDialect) {
  const char* names[] = {"dBASE II", "dBASE III+", "dBASE IV", "Enable",           "dBASE III", nullptr,
                         "FoxPro",   "Enable OA (Database)", "Clipper", "Visual dBASE 5.5", "Visual FoxPro"};
  tests::Source s;
  for (int d = 0; d <= 10; ++d) {
    s->SetOption("version", std::to_string(d).c_str());
    std::string expect = names[d] ? std::string("version= ") + names[d] + "\n" : "";
    EXPECT_EQ(Saved(s.spoke()), expect) << d;
    // What is saved loads the same dialect again.
    tests::Source back(d == 2 ? 6 : 2);
    if (names[d] != nullptr) {
      EXPECT_EQ(Loaded(back.spoke(), expect.c_str()), d);
    }
  }
}

TEST(OptionsTest, OrderNumberAndTheVersionLine) {
  tests::Source s;
  // The version line first, as saved: the order number stays.
  Load(s.spoke(), "version= FoxPro\nindex number= 3\n");
  EXPECT_EQ(Block(s.spoke()).Order(), 3);
  EXPECT_EQ(Saved(s.spoke()), "version= FoxPro\nindex number= 3\n");
  // The other way round: the version line clears the order.
  Load(s.spoke(), "index number= 3\nversion= FoxPro\n");
  EXPECT_EQ(Block(s.spoke()).Order(), 0);
  EXPECT_EQ(Saved(s.spoke()), "version= FoxPro\n");

  // SetVersion to the present dialect still clears the order; the option
  // setter with the same value doesn't call it.
  ZQDbaseOptions& block = Block(s.spoke());
  block.Order(2);
  EXPECT_EQ(s->SetOption("version", "6"), 0);
  EXPECT_EQ(block.Order(), 2);
  block.SetVersion(6);
  EXPECT_EQ(block.Order(), 0);
  block.Order(2);
  block.SetVersion(42);  // out of range: dialect kept, order cleared
  EXPECT_EQ(block.GetVersion(), 6);
  EXPECT_EQ(block.Order(), 0);

  // The memo policy through its option; not range-checked, not saved.
  EXPECT_EQ(s->SetOption("ignorememoerr", "2"), 0);
  EXPECT_EQ(block.IgnoreMemoFile(), 2);
  EXPECT_EQ(s->SetOption("IgnoreMemoErr", "7"), 0);
  EXPECT_EQ(block.IgnoreMemoFile(), 7);
  ZQString v;
  EXPECT_EQ(s->GetOption("ignorememoerr", v), 0);
  EXPECT_EQ(Text(v), "7");
  EXPECT_EQ(Saved(s.spoke()), "version= FoxPro\n");
}

TEST(OptionsTest, OptionListsAndDefinitions) {
  tests::Source s;
  ASSERT_EQ(s->OptionDefCount(), 3);
  ZQOptionDef** defs = s->GetOptionDefs();
  ASSERT_NE(defs, nullptr);
  EXPECT_STREQ(defs[0]->NameText(), "codepage");
  EXPECT_STREQ(defs[1]->NameText(), "ignorememoerr");
  EXPECT_STREQ(defs[2]->NameText(), "version");
  EXPECT_EQ(defs[3], nullptr);

  const ZQOptionDef* version = defs[2];
  EXPECT_EQ(version->Flags(), 0xC001);
  EXPECT_STREQ(version->Default(), "2");
  ASSERT_EQ(version->ValueCount(), 10);
  const char* values[] = {"0", "4", "1", "2", "3", "6", "7", "8", "9", "10"};
  for (int i = 0; i < 10; ++i) EXPECT_STREQ(version->Values()[i].value, values[i]) << i;
  EXPECT_EQ(version->Values()[0].pointer, nullptr);
  const ZQOptionDef* memo = defs[1];
  EXPECT_EQ(memo->Flags(), 1);
  EXPECT_STREQ(memo->Default(), "0");
  ASSERT_EQ(memo->ValueCount(), 3);
  EXPECT_STREQ(memo->Values()[2].value, "2");

  EXPECT_EQ(ZQDbaseOptions::ExportOptionCount(), 2);
  EXPECT_STREQ(ZQDbaseOptions::ExportOptionList()[1]->NameText(), "version");
  EXPECT_EQ(ZQDbaseOptions::ExportOptionList()[2], nullptr);
  EXPECT_EQ(Block(s.spoke()).OptionCount(), 3);
  EXPECT_EQ(Block(s.spoke()).OptionList()[0], ZQSpokeOptions::CodePageOption());
}

TEST(OptionsTest, ExchangeOfOptionBlocks) {
  tests::Source s(6);
  Block(s.spoke()).Order(0);
  // A detached block carries the dialect and the order number.
  std::unique_ptr<ZQSpokeOptions> opts(s->NewOptions());
  ASSERT_NE(opts, nullptr);
  auto& block = static_cast<ZQDbaseOptions&>(*opts);
  EXPECT_EQ(block.GetVersion(), 6);
  block.SetVersion(1);
  block.Order(4);
  ASSERT_TRUE(s->FillOptions(opts.get()));  // version first, then the order
  EXPECT_EQ(block.GetVersion(), 6);
  EXPECT_EQ(block.Order(), 0);

  // A dialect-5 block leaves the table object at dialect 2.
  block.SetVersion(5);
  EXPECT_EQ(s->SetOptions(opts.get()), 0);
  EXPECT_EQ(Version(s.spoke()), 2);

  // An order number in a dialect without indexes: 17 from the table object,
  // 13 from the connector; what was stored before the failure stays.
  block.SetVersion(1);
  block.Order(1);
  ZQDbase& dbase = DbaseTestPeer::Of(s.spoke());
  EXPECT_EQ(DbaseTestPeer::SetOptions(dbase, opts.get()), ZQ_INDEX_ERROR);
  EXPECT_EQ(Saved(s.spoke()), "version= dBASE III+\nindex number= 1\n");
  block.Order(2);
  EXPECT_EQ(s->SetOptions(opts.get()), ZQ_BAD_OPTIONS);
  EXPECT_EQ(Saved(s.spoke()), "version= dBASE III+\nindex number= 2\n");
  // The same order again is no change: 0.
  EXPECT_EQ(s->SetOptions(opts.get()), 0);

  // Blocks of another connector.
  ZQSpokeOptions foreign(1, nullptr);
  EXPECT_EQ(s->SetOptions(&foreign), ZQ_BAD_OPTIONS);
  EXPECT_EQ(DbaseTestPeer::SetOptions(dbase, &foreign), ZQ_BAD_OPTIONS);
  EXPECT_FALSE(s->FillOptions(&foreign));
  EXPECT_FALSE(s->FillOptions(nullptr));
  s->DeleteOptions(nullptr);
}

TEST(OptionsTest, TypeListsFollowTheBlockLastTouched) {
  tests::Source s(2);
  auto count = [&] {
    int n = 0;
    while (s->GetValidTypes()[n] != nullptr) ++n;
    return n;
  };
  EXPECT_EQ(count(), 6);
  {
    // A detached block of dialect 10 hands its lists to the spoke, then dies:
    // the spoke keeps its own copy.
    std::unique_ptr<ZQSpokeOptions> opts(s->NewOptions());
    static_cast<ZQDbaseOptions&>(*opts).SetVersion(10);
  }
  ASSERT_EQ(count(), 11);
  EXPECT_EQ(s->TypeByUsage('B').Kind(), DT_DOUBLE);  // Double, not Binary, in dialect 10
  EXPECT_EQ(s->TypeByUsage('T').Family(), FT_DATETIME);
  const int expect[] = {4, 5, 6, 4, 5, 6, 7, 6, 5, 8, 11};
  for (int d = 0; d <= 10; ++d) {
    s->SetOption("version", std::to_string(d).c_str());
    EXPECT_EQ(count(), expect[d]) << d;
    // The index types: Date, Numeric, Text, and Float where the list has it.
    int keys = 0;
    while (s->GetIndexTypes()[keys] != nullptr) ++keys;
    EXPECT_EQ(keys, expect[d] >= 6 ? 4 : 3) << d;
  }
  EXPECT_EQ(s->TypeByUsage('B').Kind(), DT_DOUBLE);
  s->SetOption("version", "9");
  EXPECT_EQ(s->TypeByUsage('B').Family(), FT_BINARY);
  // Text is 32000 long in Clipper, 255 elsewhere.
  s->SetOption("version", "8");
  EXPECT_EQ(s->TypeByUsage('C').MaxLength(), 32000);
  s->SetOption("version", "2");
  EXPECT_EQ(s->TypeByUsage('C').MaxLength(), 255);

  const int max_fields[] = {32, 128, 256, 128, 128, 256, 256, 128, 1000, 1024, 1024};
  for (int d = 0; d <= 10; ++d) {
    s->SetOption("version", std::to_string(d).c_str());
    EXPECT_EQ(s->MaxFieldCount(), max_fields[d]) << d;
  }
  const ZQConnTargetInfo* info = s->GetTargetInfo();
  ASSERT_NE(info, nullptr);
  EXPECT_EQ(info->words[0], 1);
  EXPECT_EQ(info->words[1] + info->words[2] + info->words[3], 0);
  EXPECT_EQ(info->words[4], 1);
  EXPECT_EQ(std::u16string(info->label), u"Source File/URI");
  EXPECT_TRUE(s->SupportIndexes());
  EXPECT_TRUE(s->SupportURI());
  EXPECT_EQ(s->RecordSeekGrade(), 9);
  EXPECT_EQ(s->_Rewind(), 0);
}

}  // namespace
