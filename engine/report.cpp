#include "engine/report.h"

#include <cstdio>
#include <vector>

namespace {

// The first examples of a kind shown in its line.
constexpr size_t kExamples = 3;

struct Kind {
  const char* singular;
  const char* plural;
  int64_t count;
  std::vector<std::string> examples;
};

WarnMode g_mode = WarnMode::kNormal;
bool g_warned = false;
std::vector<Kind> g_kinds;

void Print(const std::string& line) {
  if (g_mode == WarnMode::kStrict) fprintf(stderr, "zqdb: error (--strict): %s\n", line.c_str());
  else fprintf(stderr, "zqdb: warning: %s\n", line.c_str());
}

}  // namespace

void SetWarnings(WarnMode mode) { g_mode = mode; }
WarnMode Warnings() { return g_mode; }

void Warn(const std::string& message) {
  g_warned = true;
  if (g_mode != WarnMode::kQuiet) Print(message);
}

void WarnOf(const char* singular, const char* plural, const std::string& example, int64_t count) {
  g_warned = true;
  if (g_mode == WarnMode::kQuiet) return;
  for (Kind& k : g_kinds)
    if (k.singular == singular) {
      k.count += count;
      if (k.examples.size() < kExamples + 1) k.examples.push_back(example);
      return;
    }
  g_kinds.push_back(Kind{singular, plural, count, {example}});
}

void FlushWarnings() {
  for (const Kind& k : g_kinds) {
    std::string line = std::to_string(k.count) + " " + (k.count == 1 ? k.singular : k.plural) + " (";
    for (size_t i = 0; i < k.examples.size() && i < kExamples; ++i) line += (i ? ", " : "") + k.examples[i];
    line += k.examples.size() > kExamples || int64_t(k.examples.size()) < k.count ? ", ...)" : ")";
    Print(line);
  }
  g_kinds.clear();
}

bool WarningsFail() { return g_mode == WarnMode::kStrict && g_warned; }

int Fail(const std::string& message) {
  fprintf(stderr, "zqdb: %s\n", message.c_str());
  return 1;
}
