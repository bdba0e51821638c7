// How zqdb speaks to its user: errors and warnings, one line each on
// standard error. Warnings of one kind (field names changed, values cut) are
// gathered and told once, with their count and the first examples, so that
// a table of 200 fields gives a line and not a page. --quiet drops them;
// --strict makes each an error: the command fails and keeps no output.
#pragma once

#include <cstdint>
#include <string>

enum class WarnMode { kNormal, kQuiet, kStrict };
void SetWarnings(WarnMode mode);
WarnMode Warnings();

// A warning of its own, told as it stands.
void Warn(const std::string& message);
// One case of a kind of warning: `singular` and `plural` name the kind
// ("field name was upper-cased", "field names were upper-cased"); `example`
// is this case ("id -> ID"). `count` cases at once.
void WarnOf(const char* singular, const char* plural, const std::string& example, int64_t count = 1);
// Prints the gathered kinds, one line each, and forgets them.
void FlushWarnings();
// Under --strict, true once any warning was given: the command must fail.
bool WarningsFail();

// Prints the error; the exit status of a failed command (1).
int Fail(const std::string& message);
