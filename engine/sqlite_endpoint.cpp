// SQLite databases as a target (one table, made anew or added to) and as a
// source (the rows of one table), through Debian's libsqlite3.
//
// Column types from the field types: C and D (ISO date) and T (ISO
// date-time) TEXT, M TEXT, binary memos BLOB, N and F without decimals
// INTEGER, with decimals REAL when a double holds every value of the width
// exactly (15 digits), else NUMERIC, L INTEGER 0/1, I INTEGER, Y NUMERIC,
// B REAL. Blanks are NULL. All rows go in one transaction, so a failed run
// leaves the database as it was; a new database appears only once whole.
#include <sqlite3.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "engine/endpoints.h"
#include "engine/text_types.h"
#include "engine/text_util.h"

namespace {

std::string QuoteIdent(const std::string& name) {
  std::string out = "\"";
  for (char c : name) {
    if (c == '"') out += '"';
    out += c;
  }
  return out + "\"";
}

// Opens the database `path` for this process's one thread: the library
// is set up once before its first use without its mutexes and its memory
// statistics, which only threads sharing it need. False when it can't be
// opened (`*db` is then closed by the caller, as sqlite3_open_v2 asks).
bool OpenDatabase(const char* path, int flags, sqlite3** db) {
  static const bool configured = sqlite3_config(SQLITE_CONFIG_SINGLETHREAD) == SQLITE_OK &&
                                 sqlite3_config(SQLITE_CONFIG_MEMSTATUS, 0) == SQLITE_OK;
  (void)configured;
  return sqlite3_open_v2(path, db, flags, nullptr) == SQLITE_OK;
}

// The column type of a field of the text types (their usage letters).
const char* SqliteType(const ZQField* f) {
  switch (char(f->DataType().Usage())) {
    case 'N':
    case 'F':
      if (f->DecLen() == 0) return "INTEGER";
      return f->Length() <= 15 ? "REAL" : "NUMERIC";
    case 'L':
    case 'I': return "INTEGER";
    case 'Y': return "NUMERIC";
    case 'B': return f->FieldType() == FT_FLOAT ? "REAL" : "BLOB";
    case 'G': return "BLOB";
    default: return "TEXT";
  }
}

// The field type of an existing column, by SQLite's rules of affinity.
const ZQDType& TypeOfColumn(const std::string& declared) {
  const TextTypes& t = TextTypes::Get();
  std::string d = Upper(declared);
  if (d.find("INT") != std::string::npos) return t.integer;
  if (d.find("CHAR") != std::string::npos || d.find("CLOB") != std::string::npos || d.find("TEXT") != std::string::npos)
    return d.find("DATETIME") != std::string::npos || d.find("TIMESTAMP") != std::string::npos ? t.datetime : t.memo;
  if (d.empty() || d.find("BLOB") != std::string::npos) return t.memo;
  if (d == "DATE") return t.date;
  if (d.find("BOOL") != std::string::npos) return t.boolean;
  return t.dbl;  // REAL, FLOA, DOUB, NUMERIC, DECIMAL
}

// The columns of `table` in `db`, as fields of `out`. False when the table
// doesn't exist.
bool ColumnsOf(sqlite3* db, const std::string& table, ZQRecord* out) {
  sqlite3_stmt* st = nullptr;
  std::string sql = "PRAGMA table_info(" + QuoteIdent(table) + ")";
  if (sqlite3_prepare_v2(db, sql.c_str(), -1, &st, nullptr) != SQLITE_OK) return false;
  bool any = false;
  while (sqlite3_step(st) == SQLITE_ROW) {
    const char* name = reinterpret_cast<const char*>(sqlite3_column_text(st, 1));
    const char* type = reinterpret_cast<const char*>(sqlite3_column_text(st, 2));
    ZQDType t = TypeOfColumn(type ? type : "");
    if (char(t.Usage()) == 'D') t.Length(8);
    out->NewField(t, name ? name : "");
    any = true;
  }
  sqlite3_finalize(st);
  return any;
}

class ZQToSqlite : public ZQExport {
 public:
  explicit ZQToSqlite(const WriteOptions& opts) : ZQExport(ZQSpokeDef{}, nullptr, false), opts_(opts) {
    ReplaceValidTypes(const_cast<const ZQDType**>(TextTypes::Get().list));
  }
  ~ZQToSqlite() override { _CloseOutput(false); }

  bool SupportMode(SpokeMode mode) const override { return mode == kReplace || mode == kAppend; }
  int MaxFieldCount() override { return 2000; }  // SQLite's default column limit
  int FieldNameMaxLength() override { return 1024; }

  BATCHERR MakeFields(ZQRecord& record, const ZQConnTarget& target) override {
    sqlite3* db = nullptr;
    bool ok = OpenDatabase(target.path.c_str(), SQLITE_OPEN_READONLY, &db) && ColumnsOf(db, opts_.table_name, &record);
    sqlite3_close(db);
    if (!ok) return LogError(4, ZQ_OPEN_ERROR, "%s has no table %s", target.path.c_str(), opts_.table_name.c_str());
    return 0;
  }

  BATCHERR _OpenOutput(const ZQConnTarget& target) override {
    inserted_count_ = 0;
    path_ = target.path.c_str();
    // A database this run makes is built under a scratch name beside it and
    // renamed into place once it is whole: it needs no journal and no
    // waiting for the disk, and a failed or killed run never leaves a
    // half-written database under the name asked for. An existing database
    // is changed in place under its own journal, so that a failed or killed
    // run leaves it as it was.
    struct stat st;
    created_ = lstat(path_.c_str(), &st) != 0 && errno == ENOENT;
    work_ = created_ ? path_ + ".zqdb-part" : path_;
    if (created_) unlink(work_.c_str());  // left by a killed run
    if (!OpenDatabase(work_.c_str(), SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE, &db_))
      return Failed(ZQ_CREATE_ERROR, "cannot open");
    // Pages of 16 KiB: a bulk-loaded table is read in long runs, and the
    // larger pages take a quarter of the write calls.
    const char* setup = created_ ? "PRAGMA journal_mode = OFF; PRAGMA synchronous = OFF; "
                                   "PRAGMA locking_mode = EXCLUSIVE; PRAGMA page_size = 16384"
                                 : "PRAGMA synchronous = NORMAL";
    if (!Exec(setup) || !Exec("BEGIN IMMEDIATE")) return Failed(ZQ_CREATE_ERROR, "cannot write");
    ZQRecord& layout = *GetLayout(0);
    columns_ = layout.FieldCount();
    std::string table = QuoteIdent(opts_.table_name), names;
    for (int i = 0; i < columns_; ++i) names += (i ? ", " : "") + QuoteIdent(layout[i]->Name());
    if (GetMode() == kReplace) {
      std::string create = "CREATE TABLE " + table + " (";
      for (int i = 0; i < columns_; ++i)
        create += (i ? ", " : "") + QuoteIdent(layout[i]->Name()) + " " + SqliteType(layout[i]);
      if (!Exec("DROP TABLE IF EXISTS " + table) || !Exec(create + ")")) return Failed(ZQ_CREATE_ERROR, "cannot create the table");
    }
    // Rows go in kBatchRows at a time, one statement for them all: a
    // statement's own work (its start, its cursor, its end) is then shared by
    // the rows, and within the host parameters SQLite allows.
    int room = sqlite3_limit(db_, SQLITE_LIMIT_VARIABLE_NUMBER, -1) / (columns_ > 0 ? columns_ : 1);
    batch_ = room < 1 ? 1 : room < kBatchRows ? room : kBatchRows;
    insert_head_ = "INSERT INTO " + table + " (" + names + ") VALUES ";
    if (!Prepare(batch_, &insert_)) return Failed(ZQ_CREATE_ERROR, "cannot add to the table");
    values_.assign(size_t(batch_) * size_t(columns_), Value{});
    pending_ = 0;
    text_used_ = 0;
    target_.path = target.path;
    return 0;
  }

  BATCHERR GenerateDetailRecord(int layout_no) override {
    if (layout_no != 0) return ZQ_INDEX_ERROR;
    if (insert_ == nullptr) return ZQ_NOT_OPEN;
    ZQRecord& r = *GetLayout(0);
    Value* row = &values_[size_t(pending_) * size_t(columns_)];
    for (int i = 0; i < columns_; ++i) Take(r.GetFieldbyPos(i), &row[i]);
    ++inserted_count_;
    if (++pending_ == batch_ && !Insert(insert_)) return Failed(ZQ_WRITE_ERROR, "cannot write");
    return 0;
  }

  BATCHERR _CloseOutput(bool keep) override {
    if (db_ == nullptr) return 0;
    sqlite3_stmt* tail = nullptr;
    bool ok = keep && (pending_ == 0 || (Prepare(pending_, &tail) && Insert(tail))) && Exec("COMMIT");
    std::string why = ok ? "" : sqlite3_errmsg(db_);
    sqlite3_finalize(tail);
    sqlite3_finalize(insert_);
    insert_ = nullptr;
    if (!ok && !created_) Exec("ROLLBACK");
    if (sqlite3_close(db_) != SQLITE_OK && ok) ok = false, why = sqlite3_errmsg(db_);
    db_ = nullptr;
    if (ok && created_ && rename(work_.c_str(), path_.c_str()) != 0) ok = false, why = strerror(errno);
    if (!ok && created_) unlink(work_.c_str());  // a database this run made and didn't fill
    pending_ = 0;
    if (keep && !ok) return LogError(4, ZQ_WRITE_ERROR, "cannot write %s: %s", path_.c_str(), why.c_str());
    return 0;
  }

 private:
  static constexpr int kBatchRows = 32;

  // One value of a row waiting for its statement: its text lies in text_
  // (the fields' own buffers are the next record's by then).
  struct Value {
    enum Kind : uint8_t { kNull, kInteger, kReal, kText, kBlob } kind = kNull;
    uint32_t length = 0;  // text and blobs
    union {
      int64_t integer;
      double real;
      size_t offset;  // of text and blobs in text_
    };
    Value() : integer(0) {}
  };

  bool Exec(const std::string& sql) { return sqlite3_exec(db_, sql.c_str(), nullptr, nullptr, nullptr) == SQLITE_OK; }

  // The INSERT statement of `rows` rows.
  bool Prepare(int rows, sqlite3_stmt** out) {
    std::string marks = "(";
    for (int i = 0; i < columns_; ++i) marks += i ? ", ?" : "?";
    marks += ")";
    std::string sql = insert_head_;
    sql.reserve(sql.size() + size_t(rows) * (marks.size() + 2));
    for (int k = 0; k < rows; ++k) sql += (k ? ", " : "") + marks;
    return sqlite3_prepare_v2(db_, sql.c_str(), int(sql.size()), out, nullptr) == SQLITE_OK;
  }

  // Binds the rows waiting, as many as `st` takes, and inserts them.
  bool Insert(sqlite3_stmt* st) {
    const char* text = text_.data();
    size_t n = size_t(pending_) * size_t(columns_);
    for (size_t k = 0; k < n; ++k) {
      const Value& v = values_[k];
      int at = int(k) + 1;
      switch (v.kind) {
        case Value::kNull: sqlite3_bind_null(st, at); break;
        case Value::kInteger: sqlite3_bind_int64(st, at, v.integer); break;
        case Value::kReal: sqlite3_bind_double(st, at, v.real); break;
        case Value::kText: sqlite3_bind_text(st, at, text + v.offset, int(v.length), SQLITE_STATIC); break;
        case Value::kBlob: sqlite3_bind_blob(st, at, text + v.offset, int(v.length), SQLITE_STATIC); break;
      }
    }
    int rc = sqlite3_step(st);
    sqlite3_reset(st);
    pending_ = 0;
    text_used_ = 0;
    return rc == SQLITE_DONE;
  }

  BATCHERR Failed(BATCHERR code, const char* what) {
    std::string message = std::string(what) + " " + path_ + ": " + (db_ ? sqlite3_errmsg(db_) : "out of memory");
    return LogError(4, code, "%s", message.c_str());
  }

  void PutText(Value* v, Value::Kind kind, const char* p, size_t n) {
    if (n > text_.size() - text_used_) text_.resize(std::max(2 * text_.size(), text_used_ + n));
    v->kind = kind;
    v->offset = text_used_;
    v->length = uint32_t(n);
    memcpy(text_.data() + text_used_, p, n);
    text_used_ += n;
  }

  // The value of `f` as it will be bound.
  void Take(ZQField* f, Value* v) {
    switch (f->held()) {
      case ZQField::Held::kBlank: v->kind = Value::kNull; break;
      case ZQField::Held::kLong: v->kind = Value::kInteger, v->integer = f->LongVal(); break;
      case ZQField::Held::kDouble: v->kind = Value::kReal, v->real = f->DoubleVal(); break;
      case ZQField::Held::kBool: v->kind = Value::kInteger, v->integer = f->BoolVal() ? 1 : 0; break;
      case ZQField::Held::kDate: {
        const ZQDate& d = f->DateRef();
        char buf[10];
        PutDigits(buf, 4, d.Year());
        PutDigits(buf + 5, 2, d.Month());
        PutDigits(buf + 8, 2, d.Day());
        buf[4] = buf[7] = '-';
        PutText(v, Value::kText, buf, sizeof buf);
        break;
      }
      case ZQField::Held::kDateTime: {
        f->DateTimeRef().PrintIso(scratch_);
        PutText(v, Value::kText, scratch_.c_str(), size_t(scratch_.length()));
        break;
      }
      case ZQField::Held::kText: {
        const ZQString& s = f->StringRef();
        FIELDTYPE family = f->FieldType();
        if ((family == FT_NUMERIC || family == FT_FLOAT) && TakeNumber(s.c_str(), size_t(s.length()), v)) break;
        PutText(v, family == FT_BINARY ? Value::kBlob : Value::kText, s.c_str(), size_t(s.length()));
        break;
      }
    }
  }

  // A number held as the table's text, as an integer or a double: what the
  // column's affinity would make of the text, without SQLite parsing it
  // again. False for text that is no plain number (it goes in as text, and
  // the affinity keeps it so).
  static bool TakeNumber(const char* p, size_t n, Value* out) {
    size_t i = n > 0 && (p[0] == '-' || p[0] == '+') ? 1 : 0, digits = 0, dot = n;
    uint64_t magnitude = 0;  // wraps past 19 digits, but is used up to 15 only
    for (size_t k = i; k < n; ++k) {
      unsigned digit = unsigned(uint8_t(p[k])) - '0';
      if (digit <= 9) magnitude = magnitude * 10 + digit, ++digits;
      else if (p[k] == '.' && dot == n) dot = k;
      else return false;
    }
    if (digits == 0 || digits > 15) return false;  // beyond 15 digits SQLite's own conversion decides
    int64_t v = p[0] == '-' ? -int64_t(magnitude) : int64_t(magnitude);
    if (dot == n) {
      out->kind = Value::kInteger;
      out->integer = v;
      return true;
    }
    // Both numbers are exact doubles (15 digits, a power of ten up to
    // 10^15), so the one division rounds as strtod would.
    static const double kTens[] = {1e0, 1e1, 1e2, 1e3, 1e4, 1e5, 1e6, 1e7, 1e8, 1e9, 1e10, 1e11, 1e12, 1e13, 1e14, 1e15};
    out->kind = Value::kReal;
    out->real = double(v) / kTens[n - dot - 1];
    return true;
  }

  // `width` decimal digits of `v` (0 <= v), zero-filled.
  static void PutDigits(char* out, int width, int32_t v) {
    for (int k = width - 1; k >= 0; --k, v /= 10) out[k] = char('0' + v % 10);
  }

  WriteOptions opts_;
  std::string path_;  // the database asked for
  std::string work_;  // the file written: path_, or a new database's scratch name
  bool created_ = false;
  sqlite3* db_ = nullptr;
  sqlite3_stmt* insert_ = nullptr;  // of batch_ rows
  std::string insert_head_;         // "INSERT INTO t (a, b) VALUES "
  int columns_ = 0;
  int batch_ = 1;
  int pending_ = 0;            // rows in values_ not yet inserted
  std::vector<Value> values_;  // batch_ rows of columns_ values
  std::vector<char> text_;     // the text of the rows waiting: text_used_ bytes
  size_t text_used_ = 0;
  ZQString scratch_;
};

void DeleteSqlite(void*, ZQExport* s) { delete s; }

class SqliteTarget : public Target {
 public:
  SqliteTarget(TargetPtr spoke, const std::string& path, bool existing)
      : Target(std::move(spoke), path), existing_(existing) {}
  bool AddsToExisting() const override { return existing_; }

 private:
  bool existing_;
};

}  // namespace

std::unique_ptr<Target> MakeSqliteTarget(const std::string& path, const WriteOptions& opts, ZQImport*,
                                         std::string* error) {
  if (opts.mode == 2) return *error = "update mode needs a table as the target", nullptr;
  ZQRecord probe;
  bool existing = opts.mode == 1 && ReadSqliteLayout(path, opts, &probe);
  if (opts.mode == 1 && !existing)
    return *error = path + " has no table " + opts.table_name + " to append to", nullptr;
  return std::make_unique<SqliteTarget>(TargetPtr(new ZQToSqlite(opts), TargetDeleter{DeleteSqlite}), path, existing);
}

bool ReadSqliteLayout(const std::string& path, const WriteOptions& opts, ZQRecord* out) {
  if (access(path.c_str(), R_OK) != 0) return false;
  sqlite3* db = nullptr;
  bool ok = OpenDatabase(path.c_str(), SQLITE_OPEN_READONLY, &db) && ColumnsOf(db, opts.table_name, out);
  sqlite3_close(db);
  return ok;
}

namespace {

bool IsIsoDate(const unsigned char* p, int n) {
  if (n != 10 || p[4] != '-' || p[7] != '-') return false;
  for (int i : {0, 1, 2, 3, 5, 6, 8, 9})
    if (p[i] < '0' || p[i] > '9') return false;
  return true;
}

// What one pass over a column's values found.
struct ColumnSeen {
  bool ints = false, reals = false, text = false, blobs = false, dates = true, bools = true, exp = false;
  int max_len = 0;     // bytes of the longest value as text
  int int_digits = 0;  // of the numbers, sign included
  int frac_digits = 0;
};

class ZQFromSqlite : public ZQImport {
 public:
  explicit ZQFromSqlite(const std::string& table) : ZQImport(ZQSpokeDef{}, nullptr, false), table_(table) {}
  ~ZQFromSqlite() override { ConnectionClose(); }

  BATCHERR MakeFields() override {
    std::string path = target_.path.c_str();
    if (access(path.c_str(), R_OK) != 0)
      return LogError(4, ZQ_OPEN_ERROR, "cannot open %s: %s", path.c_str(), strerror(errno));
    if (!OpenDatabase(path.c_str(), SQLITE_OPEN_READONLY, &db_)) return Failed("cannot open");
    if (table_.empty() && !OnlyTable(&table_)) return ZQ_OPEN_ERROR;
    ZQRecord declared;
    if (!ColumnsOf(db_, table_, &declared)) {
      std::string tables;
      ListTables(&tables);
      return LogError(4, ZQ_OPEN_ERROR, "%s has no table %s (its tables:%s)", path.c_str(), table_.c_str(),
                      tables.c_str());
    }
    std::string sql = "SELECT * FROM " + QuoteIdent(table_);
    if (sqlite3_prepare_v2(db_, sql.c_str(), -1, &select_, nullptr) != SQLITE_OK) return Failed("cannot read");
    int n = sqlite3_column_count(select_);
    std::vector<ColumnSeen> seen(static_cast<size_t>(n));
    int rc;
    while ((rc = sqlite3_step(select_)) == SQLITE_ROW)
      for (int i = 0; i < n; ++i) See(i, &seen[size_t(i)]);
    if (rc != SQLITE_DONE) return Failed("cannot read");
    sqlite3_reset(select_);
    ZQRecord* layout = GetLayout(0);
    layout->ClearFields();
    for (int i = 0; i < n; ++i) {
      const char* type = sqlite3_column_decltype(select_, i);
      ZQDType t = TypeFor(seen[size_t(i)], Upper(type ? type : ""));
      if (layout->NewField(t, sqlite3_column_name(select_, i)) == nullptr) return ZQ_NO_MEMORY;
    }
    next_ = 0;
    return 0;
  }

  BATCHERR GetRecord(int32_t n) override {
    if (select_ == nullptr) return ZQ_NOT_OPEN;
    if (n < next_) {
      sqlite3_reset(select_);
      next_ = 0;
    }
    int rc = SQLITE_ROW;
    while (next_ <= n && (rc = sqlite3_step(select_)) == SQLITE_ROW) ++next_;
    if (rc == SQLITE_DONE) {
      GetLayout(0)->BlankFields();
      return ZQ_END;
    }
    if (rc != SQLITE_ROW) return Failed("cannot read");
    ZQRecord& r = *GetLayout(0);
    for (int i = 0; i < r.FieldCount(); ++i) Assign(i, r.GetFieldbyPos(i));
    return 0;
  }

  BATCHERR ConnectionClose() override {
    sqlite3_finalize(select_);
    select_ = nullptr;
    sqlite3_close(db_);
    db_ = nullptr;
    return 0;
  }

 private:
  BATCHERR Failed(const char* what) {
    return LogError(4, ZQ_READ_ERROR, "%s %s: %s", what, target_.path.c_str(), db_ ? sqlite3_errmsg(db_) : "out of memory");
  }

  void ListTables(std::string* out) {
    sqlite3_stmt* st = nullptr;
    if (sqlite3_prepare_v2(db_, "SELECT name FROM sqlite_master WHERE type = 'table' ORDER BY name", -1, &st,
                           nullptr) != SQLITE_OK)
      return;
    while (sqlite3_step(st) == SQLITE_ROW) *out += std::string(" ") + reinterpret_cast<const char*>(sqlite3_column_text(st, 0));
    sqlite3_finalize(st);
  }

  // Without --table: the database's one table.
  bool OnlyTable(std::string* out) {
    std::string tables;
    ListTables(&tables);
    if (!tables.empty() && tables.find(' ', 1) == std::string::npos) {
      *out = tables.substr(1);
      return true;
    }
    LogError(4, ZQ_OPEN_ERROR, "%s holds %s: name one with --table", target_.path.c_str(),
             tables.empty() ? "no table" : ("the tables" + tables).c_str());
    return false;
  }

  void See(int i, ColumnSeen* s) {
    int type = sqlite3_column_type(select_, i);
    if (type == SQLITE_NULL) return;
    const unsigned char* p = sqlite3_column_text(select_, i);
    int n = sqlite3_column_bytes(select_, i);
    if (n > s->max_len) s->max_len = n;
    if (type == SQLITE_INTEGER) {
      s->ints = true;
      if (n > s->int_digits) s->int_digits = n;
      int64_t v = sqlite3_column_int64(select_, i);
      s->bools = s->bools && (v == 0 || v == 1);
      s->dates = false;
    } else if (type == SQLITE_FLOAT) {
      s->reals = true;
      s->bools = s->dates = false;
      const char* dot = static_cast<const char*>(memchr(p, '.', size_t(n)));
      if (memchr(p, 'e', size_t(n)) != nullptr || memchr(p, 'I', size_t(n)) != nullptr || memchr(p, 'N', size_t(n)) != nullptr) s->exp = true;
      int whole = dot ? int(dot - reinterpret_cast<const char*>(p)) : n;
      int frac = dot ? n - whole - 1 : 0;
      if (whole > s->int_digits) s->int_digits = whole;
      if (frac > s->frac_digits) s->frac_digits = frac;
    } else {
      (type == SQLITE_BLOB ? s->blobs : s->text) = true;
      s->bools = false;
      s->dates = s->dates && type == SQLITE_TEXT && IsIsoDate(p, n);
    }
  }

  // The field type of a column: by the values it holds, the declared type
  // telling logicals from integers.
  static ZQDType TypeFor(const ColumnSeen& s, const std::string& declared) {
    const TextTypes& t = TextTypes::Get();
    ZQDType out = t.text;
    if (s.blobs || (s.text && (s.ints || s.reals))) {
      out = s.max_len > 254 || s.blobs ? t.memo : t.text;
    } else if (s.text) {
      if (s.dates) return t.date;  // as a CSV column of ISO dates is
      out = s.max_len > 254 ? t.memo : t.text;
    } else if (s.ints && !s.reals) {
      if (s.bools && declared.find("BOOL") != std::string::npos) return t.boolean;
      out = t.numeric;
      out.Length(s.int_digits);
      out.DecimalPlaces(0);
      return s.int_digits <= 20 ? out : t.dbl;
    } else if (s.reals) {
      int w = s.int_digits + 1 + s.frac_digits;
      if (s.exp || w > 20 || s.frac_digits > 15) return t.dbl;
      out = t.numeric;
      out.Length(w);
      out.DecimalPlaces(int16_t(s.frac_digits));
      return out;
    }
    if (char(out.Usage()) == 'C') out.Length(s.max_len > 0 ? s.max_len : 1);
    return out;
  }

  void Assign(int i, ZQField* f) {
    int type = sqlite3_column_type(select_, i);
    if (type == SQLITE_NULL) {
      f->Blank();
      return;
    }
    switch (char(f->DataType().Usage())) {
      case 'L': f->SetBool(sqlite3_column_int64(select_, i) != 0); return;
      case 'B': *f = sqlite3_column_double(select_, i); return;
      default: break;
    }
    const void* p = type == SQLITE_BLOB ? sqlite3_column_blob(select_, i) : sqlite3_column_text(select_, i);
    f->AssignText(static_cast<const char*>(p), int32_t(sqlite3_column_bytes(select_, i)));
  }

  std::string table_;
  sqlite3* db_ = nullptr;
  sqlite3_stmt* select_ = nullptr;
  int32_t next_ = 0;
};

void DeleteSqliteSource(void*, ZQImport* s) { delete s; }

}  // namespace

bool OpenSqliteSource(const std::string& path, const ReadOptions& opts, SourcePtr* out, std::string* error) {
  SourcePtr source(new ZQFromSqlite(opts.table_name), SourceDeleter{DeleteSqliteSource});
  ZQConnTarget t;
  t.path = path.c_str();
  source->SetUserInfo(t);
  if (source->MakeFields() != 0) {
    *error = source->LastErrorMessage();
    return false;
  }
  *out = std::move(source);
  return true;
}
