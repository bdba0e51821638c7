// The dialect options: names and numbers, the saved text form, the order
// number, the option lists, and the exchange of option blocks.
#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <vector>

#include "tests/support/dbase_peer.h"
#include "tests/support/read_harness.h"

namespace {

std::string Saved(ZQFromDbase* spoke) {
  ZQString text;
  spoke->SaveOptions(text);
  return text.c_str();
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

TEST(OptionsTest, DialectByNameInAnyCaseOrByNumber) {
  struct Case {
    const char* load;
    int dialect;  // from 9
    const char* saved;
  } cases[] = {
      {"version= dBase iv\n", 2, "dBASE IV"},
      {"VERSION= 10\n", 10, "Visual FoxPro"},
      // Other products' names load their dialect (more in tests/cli/options.sh);
      // saving writes the dialect's name.
      {"version= alpha four\n", 1, "dBASE III+"},
      {"version= Action Plus (dBASE II)\n", 0, "dBASE II"},
      // Nothing fits: unknown names, numbers without a row, other keywords.
      {"version= dBASE V\nversion= 5\nversion= 11\nversion= -1\ncolour= blue\n", 9, "Visual dBASE 5.5"},
  };
  for (const Case& c : cases) {
    tests::Source s(9);
    Load(s.spoke(), c.load);
    EXPECT_EQ(Version(s.spoke()), c.dialect) << c.load;
    EXPECT_EQ(Saved(s.spoke()), std::string("version= ") + c.saved + "\n") << c.load;
  }

  // Each dialect saved by its name, which loads it again; 5 has none.
  const char* names[] = {"dBASE II", "dBASE III+", "dBASE IV", "Enable",           "dBASE III", nullptr,
                         "FoxPro",   "Enable OA (Database)", "Clipper", "Visual dBASE 5.5", "Visual FoxPro"};
  tests::Source s;
  for (int d = 0; d <= 10; ++d) {
    EXPECT_EQ(s->SetOption("version", std::to_string(d).c_str()), 0);
    EXPECT_EQ(Version(s.spoke()), d);
    std::string expect = names[d] ? std::string("version= ") + names[d] + "\n" : "";
    EXPECT_EQ(Saved(s.spoke()), expect) << d;
    tests::Source back(d == 2 ? 6 : 2);
    Load(back.spoke(), expect.c_str());
    EXPECT_EQ(Version(back.spoke()), names[d] ? d : 2) << d;
  }
  // Out of range, or not a number (0): the dialect set through the option.
  EXPECT_EQ(s->SetOption("version", "12"), 0);
  EXPECT_EQ(Version(s.spoke()), 10);
  EXPECT_EQ(s->SetOption("version", "dBASE IV"), 0);
  EXPECT_EQ(Version(s.spoke()), 0);
}

TEST(OptionsTest, OrderNumberAndTheVersionLine) {
  tests::Source s;
  ZQDbaseOptions& block = Block(s.spoke());
  // The version line first, as saved: the order number stays.
  Load(s.spoke(), "version= FoxPro\nindex number= 3\n");
  EXPECT_EQ(block.Order(), 3);
  EXPECT_EQ(Saved(s.spoke()), "version= FoxPro\nindex number= 3\n");
  // The other way round: the version line clears the order.
  Load(s.spoke(), "index number= 3\nversion= FoxPro\n");
  EXPECT_EQ(block.Order(), 0);
  EXPECT_EQ(Saved(s.spoke()), "version= FoxPro\n");

  // SetVersion to the present dialect still clears the order; the option
  // setter with the same value doesn't call it.
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
  EXPECT_EQ(s->SetOption("IgnoreMemoErr", "7"), 0);
  EXPECT_EQ(block.IgnoreMemoFile(), 7);
  ZQString v;
  EXPECT_EQ(s->GetOption("ignorememoerr", v), 0);
  EXPECT_STREQ(v.c_str(), "7");
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
  // The default and the values of "version", then of "ignorememoerr".
  EXPECT_EQ(defs[2]->Flags(), 0xC001);
  EXPECT_EQ(defs[1]->Flags(), 1);
  auto described = [](const ZQOptionDef* def) {
    std::vector<std::string> out{def->Default()};
    for (int i = 0; i < def->ValueCount(); ++i) out.push_back(def->Values()[i].value);
    return out;
  };
  using List = std::vector<std::string>;
  EXPECT_EQ(described(defs[2]), (List{"2", "0", "4", "1", "2", "3", "6", "7", "8", "9", "10"}));
  EXPECT_EQ(defs[2]->Values()[0].pointer, nullptr);
  EXPECT_EQ(described(defs[1]), (List{"0", "0", "1", "2"}));

  EXPECT_EQ(ZQDbaseOptions::ExportOptionCount(), 2);
  EXPECT_STREQ(ZQDbaseOptions::ExportOptionList()[1]->NameText(), "version");
  EXPECT_EQ(ZQDbaseOptions::ExportOptionList()[2], nullptr);
  EXPECT_EQ(Block(s.spoke()).OptionCount(), 3);
  EXPECT_EQ(Block(s.spoke()).OptionList()[0], ZQSpokeOptions::CodePageOption());
}

TEST(OptionsTest, ExchangeOfOptionBlocks) {
  tests::Source s(6);
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
  auto count = [](const ZQDType* const* list) {
    int n = 0;
    while (list[n] != nullptr) ++n;
    return n;
  };
  {
    // A detached block of dialect 10 hands its lists to the spoke, then dies:
    // the spoke keeps its own copy.
    std::unique_ptr<ZQSpokeOptions> opts(s->NewOptions());
    static_cast<ZQDbaseOptions&>(*opts).SetVersion(10);
  }
  ASSERT_EQ(count(s->GetValidTypes()), 11);
  EXPECT_EQ(s->TypeByUsage('B').Kind(), DT_DOUBLE);  // Double, not Binary, in dialect 10
  EXPECT_EQ(s->TypeByUsage('T').Family(), FT_DATETIME);
  // Per dialect: the valid types, and the fields a table may have. The index
  // types are Date, Numeric, Text, and Float where the list has it.
  const int types[] = {4, 5, 6, 4, 5, 6, 7, 6, 5, 8, 11};
  const int max_fields[] = {32, 128, 256, 128, 128, 256, 256, 128, 1000, 1024, 1024};
  for (int d = 0; d <= 10; ++d) {
    s->SetOption("version", std::to_string(d).c_str());
    EXPECT_EQ(count(s->GetValidTypes()), types[d]) << d;
    EXPECT_EQ(count(s->GetIndexTypes()), types[d] >= 6 ? 4 : 3) << d;
    EXPECT_EQ(s->MaxFieldCount(), max_fields[d]) << d;
  }
  s->SetOption("version", "9");
  EXPECT_EQ(s->TypeByUsage('B').Family(), FT_BINARY);
  // Text is 32000 long in Clipper, 255 elsewhere.
  s->SetOption("version", "8");
  EXPECT_EQ(s->TypeByUsage('C').MaxLength(), 32000);
  s->SetOption("version", "2");
  EXPECT_EQ(s->TypeByUsage('C').MaxLength(), 255);

  const ZQConnTargetInfo* info = s->GetTargetInfo();
  ASSERT_NE(info, nullptr);
  EXPECT_EQ(std::vector<int>(info->words, info->words + 5), (std::vector<int>{1, 0, 0, 0, 1}));
  EXPECT_EQ(std::u16string(info->label), u"Source File/URI");
  EXPECT_TRUE(s->SupportIndexes());
  EXPECT_TRUE(s->SupportURI());
  EXPECT_EQ(s->RecordSeekGrade(), 9);
  EXPECT_EQ(s->_Rewind(), 0);
}

}  // namespace
