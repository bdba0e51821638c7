// The connectors' indexes: the target makes them with a new table, keeps
// them with an existing one and gives every written record its key; the
// source lists them and opens the one selected by its number.
#include <gtest/gtest.h>

#include <string>

#include "tests/support/todbase_harness.h"
#include "host/platform.h"
#include "index/mdx.h"

namespace {

using tests::ScratchPath;

// Writes `names` into a new dBASE IV table at `path` with the indexes given
// as "NAME=EXPR" (NAME C(10), QTY N(5)).
void MakeTable(const std::string& path, std::initializer_list<const char*> indexes,
               std::initializer_list<const char*> names, int mode = 0) {
  tests::Target t(2, mode);
  t.Add('C', "NAME", 10);
  t.Add('N', "QTY", 5);
  for (std::string d : indexes) {
    auto* index = new ZQIndexDef;
    index->Name(d.substr(0, d.find('=')).c_str());
    ASSERT_TRUE(t->ParseIndexExpression(d.substr(d.find('=') + 1).c_str(), index));
    t->AddIndex(index);
  }
  ASSERT_EQ(t.Open(path), 0);
  int qty = 0;
  for (const char* name : names) ASSERT_EQ(t.Put({name, std::to_string(++qty).c_str()}), 0);
  ASSERT_EQ(t.Close(), 0);
}

std::string Walk(const std::string& base, const char* tag) {
  ZQDBMdx ix(base.c_str(), tag);
  std::string out;
  ZQString key;
  for (int32_t r = ix.OK() ? ix.FirstKey(key) : -1; r != -1; r = ix.NextKey(key))
    out += std::string(key.c_str(), 3) + std::to_string(r) + " ";
  return out;
}

BATCHERR SelectOrder(tests::Source& s, int order) {
  ZQSpokeOptions* o = s->NewOptions();
  s->FillOptions(o);
  static_cast<ZQDbaseOptions*>(o)->Order(order);
  BATCHERR rc = s->SetOptions(o);
  s->DeleteOptions(o);
  return rc;
}

TEST(TargetIndexes, EveryRecordGetsAKeyInEveryIndexNewOrKept) {
  std::string path = ScratchPath("ix.dbf"), base = ScratchPath("ix");
  MakeTable(path, {"BYNAME=NAME", "BYQTY=QTY+NAME"}, {"cid", "ann", "bob"});
  EXPECT_EQ(Walk(base, "BYNAME"), "ann1 bob2 cid0 ");
  // Appending with no index list: the table's own tags are picked up.
  MakeTable(path, {}, {"abe"}, 1);
  EXPECT_EQ(Walk(base, "BYNAME"), "abe3 ann1 bob2 cid0 ");
  EXPECT_EQ(Walk(base, "byqty").size(), 4u * 5);
  // A new table without indexes leaves an MDX file of that name alone; one
  // with any index removes it, and an NDX definition makes its file where
  // it is named.
  MakeTable(path, {}, {"x"});
  EXPECT_EQ(_access((base + ".mdx").c_str(), 0), 0);
  std::string ndx = ScratchPath("alone.ndx");
  MakeTable(path, {(ndx + "=NAME").c_str()}, {"y"});
  EXPECT_EQ(Walk(base, ndx.c_str()), "y  0 ");
  EXPECT_NE(_access((base + ".mdx").c_str(), 0), 0);
}

TEST(SourceIndexes, AreListedAndSelectedByNumber) {
  std::string path = ScratchPath("sel.dbf");
  MakeTable(path, {"BYNAME=NAME", "BYQTY=QTY"}, {"bob", "ann"});
  tests::Source s(2);
  ASSERT_EQ(s.Open(path), 0);
  ZQIndexDef* const* list = s->IndexList();
  ASSERT_NE(list, nullptr);
  EXPECT_STREQ(list[0]->Name(), "BYNAME");
  EXPECT_STREQ(list[1]->Name(), "BYQTY");
  EXPECT_EQ(SelectOrder(s, 2), 0);
  // Records still come in the table's order with an index selected.
  ASSERT_EQ(s.Open(path), 0);
  EXPECT_EQ(s.FirstColumn(), (std::vector<std::string>{"bob", "ann"}));
  EXPECT_EQ(SelectOrder(s, 0), 0);
  EXPECT_EQ(SelectOrder(s, 3), ZQ_BAD_OPTIONS);  // no third index
  tests::Source old(1);
  ASSERT_EQ(old.Open(path), 0);
  EXPECT_EQ(old->IndexList(), nullptr);  // dBASE III+ lists no index
  EXPECT_EQ(SelectOrder(old, 1), ZQ_BAD_OPTIONS);
}

}  // namespace
