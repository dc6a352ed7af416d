// SPDX-License-Identifier: MIT
// command_line: from the arguments of the process to a verb that has run.
#pragma once

#include "failure.h"

namespace ktrg
{

// Runs the verb and prints whatever fails. Returns the exit code.
[[nodiscard]] int run_command_line(int argc, const char * const * argv);

} // namespace ktrg
