#include "host/cli/cli.h"

int main(int argc, char** argv) { return appsync::host::runCommandLine(argc, argv); }
