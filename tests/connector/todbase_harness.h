// Moved to tests/support/; kept for the index tests that still include it here.
#pragma once
#include "tests/support/todbase_harness.h"
