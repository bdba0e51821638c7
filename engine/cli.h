// The `zqdb` command line: parsing and the commands.
#pragma once

int ZqdbMain(int argc, char** argv);
