#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "engine/cli.h"

int main(int argc, char** argv) {
  // Output to a file or pipe in one block, so that a failed write is seen,
  // with its reason, by the flush below.
  static char buffer[1 << 16];
  if (!isatty(STDOUT_FILENO)) setvbuf(stdout, buffer, _IOFBF, sizeof buffer);
  int rc = ZqdbMain(argc, argv);
  // What went to standard output through stdio (info, formats, the usage)
  // is only known written once flushed: a full disk or a closed pipe there
  // is a failed command, not a silent success.
  errno = 0;
  bool failed = fflush(stdout) != 0 || ferror(stdout);
  if (failed && rc == 0) {  // a command that failed has said why already
    fprintf(stderr, "zqdb: cannot write the output: %s\n", strerror(errno != 0 ? errno : EIO));
    return 1;
  }
  return rc;
}
