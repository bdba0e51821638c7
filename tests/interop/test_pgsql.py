"""The pgsql script of tables of every dialect, loaded into a real
PostgreSQL server started here on a scratch directory and port as a
non-root user, and selected back equal to zqdb cat --format jsonl. If the
server can't start, the test says so and exits 77, which CTest counts as
skipped, never as passed."""

import glob
import json
import os
import pwd
import socket
import sys

sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
from common import ZQDB, Suite, must, run, workdir  # noqa: E402
from databases import DIALECTS, compare, make_corpus  # noqa: E402

s = Suite("pgsql")


def skip(why):
    print("SKIPPED pgsql: %s" % why)
    sys.exit(77)


bins = sorted(glob.glob("/usr/lib/postgresql/*/bin"))
if not bins:
    skip("no PostgreSQL server installed")
BIN = bins[-1]

with workdir() as d:
    os.chmod(d, 0o755)
    # The server refuses to run as root: as root, run it as nobody.
    as_user = []
    if os.geteuid() == 0:
        as_user = ["runuser", "-u", "nobody", "--"]
        nobody = pwd.getpwnam("nobody")
    data, sock = os.path.join(d, "pgdata"), os.path.join(d, "sock")
    os.mkdir(sock)
    if as_user:
        os.chown(d, nobody.pw_uid, nobody.pw_gid)
        os.chown(sock, nobody.pw_uid, nobody.pw_gid)
    with socket.socket() as probe:
        probe.bind(("127.0.0.1", 0))
        port = str(probe.getsockname()[1])
    rc, _, err = run(as_user + [BIN + "/initdb", "-D", data, "-U", "zq", "-A", "trust", "-E", "UTF8", "--no-locale"])
    if rc != 0:
        skip("initdb failed: " + err.strip()[-300:])
    log = os.path.join(d, "server.log")
    rc, _, err = run(as_user + [BIN + "/pg_ctl", "-D", data, "-l", log, "-w", "-t", "30", "start",
                                "-o", "-p %s -k %s -c listen_addresses=''" % (port, sock)])
    if rc != 0:
        skip("the server did not start: " + err.strip()[-300:])
    try:
        psql = ["psql", "-X", "-q", "-v", "ON_ERROR_STOP=1", "-h", sock, "-p", port, "-U", "zq", "-d", "postgres"]
        tables = make_corpus(d)
        for v in DIALECTS:
            with s.case("dialect %d" % v):
                script = os.path.join(d, "corpus%d.sql" % v)
                must([ZQDB, "convert", tables[v], script, "--format", "pgsql", "--no-progress"])
                must(psql + ["-f", script])
                rc, out, err = run(psql + ["-At", "-c", "SELECT json_agg(t) FROM corpus%d t" % v])
                rows = json.loads(out) if rc == 0 and out.strip() else []
                compare(s, "dialect %d" % v, tables[v], rows)
    finally:
        run(as_user + [BIN + "/pg_ctl", "-D", data, "-m", "fast", "-w", "stop"])

s.done()
