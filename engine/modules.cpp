#include "engine/modules.h"

#include <dirent.h>
#include <dlfcn.h>
#include <fcntl.h>
#include <strings.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>

#include "connector/trailer.h"
#include "host/endian.h"

// The connector classes of the class stem "Dbase", declared and never
// defined here: the engine needs their names for the factories' exact types,
// never their members.
class ZQFromDbase;
class ZQToDbase;

namespace {

// Calls a module's factories through pointers of their own types. A
// connector's class has the framework's ZQImport or ZQExport as its first
// base, so the object and its base share an address.
template <class From, class To>
struct TypedCalls {
  static ZQImport* NewSource(void* fn, const ZQSpokeDef& def) {
    return reinterpret_cast<ZQImport*>(reinterpret_cast<From* (*)(const ZQSpokeDef&)>(fn)(def));
  }
  static void DeleteSource(void* fn, ZQImport* s) {
    reinterpret_cast<void (*)(From*)>(fn)(reinterpret_cast<From*>(s));
  }
  static ZQExport* NewTarget(void* fn, const ZQSpokeDef& def) {
    return reinterpret_cast<ZQExport*>(reinterpret_cast<To* (*)(const ZQSpokeDef&)>(fn)(def));
  }
  static void DeleteTarget(void* fn, ZQExport* t) { reinterpret_cast<void (*)(To*)>(fn)(reinterpret_cast<To*>(t)); }
};

// The class stems whose factories zqdb can call, with their typed calls.
struct StemCalls {
  const char* stem;
  ZQImport* (*new_source)(void*, const ZQSpokeDef&);
  void (*delete_source)(void*, ZQImport*);
  ZQExport* (*new_target)(void*, const ZQSpokeDef&);
  void (*delete_target)(void*, ZQExport*);
};
using DbaseCalls = TypedCalls<ZQFromDbase, ZQToDbase>;
const StemCalls kStemCalls[] = {
    {"Dbase", DbaseCalls::NewSource, DbaseCalls::DeleteSource, DbaseCalls::NewTarget, DbaseCalls::DeleteTarget},
};

// No module carries more definitions than this; a larger count is damage.
constexpr uint32_t kMaxDefinitions = 1024;
// Nor a larger trailer.
constexpr uint32_t kMaxTrailer = 1 << 20;

std::string g_module_path;

// Reads a NUL-ended text at `*p` within [*p, end); false if it has no NUL.
bool Text(const uint8_t*& p, const uint8_t* end, std::string* out) {
  const void* nul = memchr(p, 0, size_t(end - p));
  if (nul == nullptr) return false;
  out->assign(reinterpret_cast<const char*>(p), size_t(static_cast<const uint8_t*>(nul) - p));
  p = static_cast<const uint8_t*>(nul) + 1;
  return true;
}

bool Word(const uint8_t*& p, const uint8_t* end, uint32_t* out) {
  if (end - p < 4) return false;
  *out = GetBe32(p);
  p += 4;
  return true;
}

bool ParseDefinition(const uint8_t* p, const uint8_t* end, ConnectorDef* d, std::string* why) {
  uint32_t w[8];
  for (uint32_t& x : w)
    if (!Word(p, end, &x)) return *why = "a definition is shorter than its words", false;
  d->number = w[1];
  uint32_t hi, lo;
  if (!Text(p, end, &d->key) || !Text(p, end, &d->display) || !Word(p, end, &hi) || !Word(p, end, &lo) ||
      !Text(p, end, &d->option_text) || !Text(p, end, &d->extension) || !Text(p, end, &d->display) ||
      !Text(p, end, &d->short_name) || !Text(p, end, &d->module_stem) || !Text(p, end, &d->class_stem))
    return *why = "a definition's texts run past its length", false;
  d->flags = uint64_t{hi} << 32 | lo;
  uint32_t tail[3], end_word;
  for (uint32_t& x : tail)
    if (!Word(p, end, &x)) return *why = "a definition ends early", false;
  if (!Text(p, end, &d->kind) || !Word(p, end, &end_word))
    return *why = "a definition's kind runs past its length", false;
  if (p != end) return *why = "a definition is longer than its fields", false;
  if (d->class_stem.empty() || d->key.empty()) return *why = "a definition without a key or class stem", false;
  return true;
}

}  // namespace

TrailerStatus ParseTrailer(const uint8_t* tail, size_t tail_size, uint64_t file_size,
                           std::vector<ConnectorDef>* out, std::string* why) {
  if (tail_size < size_t(trailer::kTailSize) || file_size < trailer::kTailSize) return TrailerStatus::kNone;
  const uint8_t* end = tail + tail_size;
  if (memcmp(end - 8, trailer::kMagic, 8) != 0) return TrailerStatus::kNone;
  uint32_t count = GetBe32(end - 16);
  uint32_t size = GetBe32(end - 12);
  if (count == 0 || count > kMaxDefinitions) return *why = "a definition count of " + std::to_string(count), TrailerStatus::kDamaged;
  if (size > kMaxTrailer || uint64_t{size} + trailer::kTailSize > file_size || size + 16u > tail_size)
    return *why = "a trailer size that points outside the file", TrailerStatus::kDamaged;
  if (uint64_t{count} * 4 > size) return *why = "more lengths than the trailer holds", TrailerStatus::kDamaged;
  const uint8_t* block = end - 16 - size;
  const uint8_t* lengths = end - 16 - 4 * size_t(count);
  uint64_t sum = 0;
  for (uint32_t i = 0; i < count; ++i) sum += GetBe32(lengths + 4 * i);
  if (sum != size - 4 * uint64_t{count}) return *why = "definition lengths that don't add up", TrailerStatus::kDamaged;
  std::vector<ConnectorDef> defs;
  const uint8_t* p = block;
  for (uint32_t i = 0; i < count; ++i) {
    uint32_t len = GetBe32(lengths + 4 * i);
    ConnectorDef d;
    if (!ParseDefinition(p, p + len, &d, why)) return TrailerStatus::kDamaged;
    defs.push_back(std::move(d));
    p += len;
  }
  // The walk ends exactly on the table of lengths, by the sum above.
  out->insert(out->end(), defs.begin(), defs.end());
  return TrailerStatus::kOk;
}

void SetModulePath(const std::string& dirs) { g_module_path = dirs; }

std::vector<std::string> ModuleRegistry::SearchPath() {
  std::vector<std::string> dirs;
  auto add_list = [&](const std::string& list) {
    size_t start = 0;
    while (start <= list.size()) {
      size_t colon = list.find(':', start);
      std::string d = list.substr(start, colon == std::string::npos ? std::string::npos : colon - start);
      if (!d.empty()) dirs.push_back(d);
      if (colon == std::string::npos) break;
      start = colon + 1;
    }
  };
  if (!g_module_path.empty()) add_list(g_module_path);
  if (const char* env = getenv("ZQDB_MODULE_PATH")) add_list(env);
  // Beside the executable: the build tree, or a relocated install.
  char exe[4096];
  ssize_t n = readlink("/proc/self/exe", exe, sizeof exe - 1);
  if (n > 0) {
    exe[n] = '\0';
    char* slash = strrchr(exe, '/');
    if (slash != nullptr) {
      *slash = '\0';
      dirs.push_back(exe);
      dirs.push_back(std::string(exe) + "/../lib/zqdb");
    }
  }
#ifdef ZQ_MODULE_DIR
  dirs.push_back(ZQ_MODULE_DIR);
#endif
  return dirs;
}

ModuleRegistry& ModuleRegistry::Get() {
  static ModuleRegistry registry;
  static bool scanned = false;
  if (!scanned) {
    scanned = true;
    for (const std::string& d : SearchPath()) registry.ScanDirectory(d, &registry.warnings_);
  }
  return registry;
}

void ModuleRegistry::ScanDirectory(const std::string& dir, std::vector<std::string>* warnings) {
  DIR* d = opendir(dir.c_str());
  if (d == nullptr) return;
  std::vector<std::string> names;
  while (struct dirent* e = readdir(d)) {
    std::string name = e->d_name;
    if (name.size() > 3 && name.compare(name.size() - 3, 3, ".so") == 0) names.push_back(name);
  }
  closedir(d);
  for (const std::string& name : names) ScanFile(dir + "/" + name, warnings);
}

bool ModuleRegistry::ScanFile(const std::string& path, std::vector<std::string>* warnings) {
  char real[4096];
  std::string key = realpath(path.c_str(), real) ? real : path;
  for (const ConnectorDef& d : defs_)
    if (d.file == key) return true;  // the same module by another path
  int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) return false;
  struct stat st;
  bool ok = false;
  uint8_t last[trailer::kTailSize];
  if (fstat(fd, &st) == 0 && S_ISREG(st.st_mode) && st.st_size >= trailer::kTailSize &&
      pread(fd, last, sizeof last, st.st_size - off_t(sizeof last)) == ssize_t(sizeof last) &&
      memcmp(last + 8, trailer::kMagic, 8) == 0) {
    // The magic is there: read as much as the trailer says it takes (the
    // parser checks that against the file), at most the largest trailer.
    uint64_t said = uint64_t{GetBe32(last + 4)} + trailer::kTailSize;
    uint64_t cap = std::min<uint64_t>(uint64_t(st.st_size), uint64_t{kMaxTrailer} + trailer::kTailSize);
    size_t want = size_t(std::min(said, cap));
    std::vector<uint8_t> tail(want);
    uint8_t head[4] = {0};
    bool read_ok = pread(fd, tail.data(), want, st.st_size - off_t(want)) == ssize_t(want) &&
                   pread(fd, head, 4, 0) == 4;
    std::vector<ConnectorDef> found;
    std::string why;
    TrailerStatus s = read_ok ? ParseTrailer(tail.data(), want, uint64_t(st.st_size), &found, &why)
                              : TrailerStatus::kNone;
    if (s == TrailerStatus::kOk && memcmp(head, "\x7f" "ELF", 4) != 0) {
      s = TrailerStatus::kDamaged;
      why = "a trailer on a file that is no loadable module";
    }
    if (s == TrailerStatus::kDamaged) {
      warnings->push_back(path + " is skipped: " + why);
    } else if (s == TrailerStatus::kOk) {
      for (ConnectorDef& d : found) {
        d.file = key;
        defs_.push_back(d);
      }
      ok = true;
    }
  }
  close(fd);
  return ok;
}

const ConnectorDef* ModuleRegistry::ByShortName(const std::string& name) const {
  for (const ConnectorDef& d : defs_)
    if (strcasecmp(d.short_name.c_str(), name.c_str()) == 0) return &d;
  return nullptr;
}

const ConnectorDef* ModuleRegistry::Default() const {
  for (const ConnectorDef& d : defs_)
    if (d.option_text.empty()) return &d;
  return defs_.empty() ? nullptr : &defs_[0];
}

bool ModuleRegistry::Load(const ConnectorDef& def, SpokeFactories* out, std::string* error) {
  const StemCalls* calls = nullptr;
  for (const StemCalls& c : kStemCalls)
    if (def.class_stem == c.stem) calls = &c;
  std::string stem = def.class_stem;
  if (calls == nullptr) {
    *error = def.file + ": zqdb knows no connector classes of the class stem " + stem;
    return false;
  }
  void* handle = nullptr;
  for (const Loaded& l : loaded_)
    if (l.file == def.file) handle = l.handle;
  if (handle == nullptr) {
    handle = dlopen(def.file.c_str(), RTLD_NOW | RTLD_LOCAL);
    if (handle == nullptr) {
      const char* e = dlerror();
      *error = "cannot load " + def.file + ": " + (e ? e : "unknown error");
      return false;
    }
    loaded_.push_back({def.file, handle});
  }
  void* ns = dlsym(handle, ("NewFrom" + stem).c_str());
  void* ds = dlsym(handle, ("DeleteFrom" + stem).c_str());
  void* nt = dlsym(handle, ("NewTo" + stem).c_str());
  void* dt = dlsym(handle, ("DeleteTo" + stem).c_str());
  if (ns == nullptr || ds == nullptr || nt == nullptr || dt == nullptr) {
    *error = def.file + " lacks the factories of " + stem;
    return false;
  }
  out->new_source = calls->new_source;
  out->delete_source = calls->delete_source;
  out->new_target = calls->new_target;
  out->delete_target = calls->delete_target;
  out->fns[0] = ns, out->fns[1] = ds, out->fns[2] = nt, out->fns[3] = dt;
  return true;
}
