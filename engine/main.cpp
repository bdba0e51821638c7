#include "engine/cli.h"

int main(int argc, char** argv) { return ZqdbMain(argc, argv); }
