// SPDX-License-Identifier: MIT
// ktrg: the registry from a shell. A program over the public libraries: what it can do, a caller can do.
//
// The road: command_line -> a verb (verb_*.cpp) -> registry (the library) or table_file (the file itself) -> output.
#include <csignal>

#include "command_line.h"

int main(int argc, char ** argv)
{
    // A reader that went away ends us quietly, also where our parent ignores the signal.
    std::signal(SIGPIPE, SIG_DFL);
    return ktrg::run_command_line(argc, argv);
}
