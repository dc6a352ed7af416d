// SPDX-License-Identifier: MIT
// interrupt: the signal handler sets a flag and nothing else.
#include "interrupt.h"

#include <csignal>

#include "failure.h"

namespace ktrg
{

namespace
{

volatile std::sig_atomic_t Interrupted = 0;

void note(int)
{
    Interrupted = 1;
}

} // namespace

void note_interrupts()
{
    struct sigaction action {
    };
    action.sa_handler = note;
    action.sa_flags   = static_cast<int>(SA_RESETHAND); // and no SA_RESTART: a read that waits ends
    sigemptyset(&action.sa_mask);
    sigaction(SIGINT, &action, nullptr);
    sigaction(SIGTERM, &action, nullptr);
}

bool interrupted()
{
    return Interrupted != 0;
}

void stop_if_interrupted()
{
    if (interrupted())
        throw failure(exit_code::interrupted, "", "interrupted; nothing was changed");
}

} // namespace ktrg
