// SPDX-License-Identifier: MIT
// interrupt: Ctrl-C ends a change between two rows, so that its transaction is dropped as a whole.
#pragma once

namespace ktrg
{

// From now on the first SIGINT or SIGTERM is noted; a second one ends the process at once.
void note_interrupts();

[[nodiscard]] bool interrupted();

// Throws the failure of exit code 130 if there was an interrupt.
void stop_if_interrupted();

} // namespace ktrg
