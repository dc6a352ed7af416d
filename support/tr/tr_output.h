// SPDX-License-Identifier: MIT
// tr_output: where events go: to the sink of the program, or as lines to a file. Internal to the trace library.
#pragma once

#include "kt_tr.h"

// Stamps the event with time and thread, and brings it to the sink, or else to the file if its component is traced.
// Keeps errno.
void tr_i_deliver(tr_event_t & event);

// Writes the event as a line to the file that KT_TRACE_FILE names, or to standard error, in one write.
void tr_i_write_line(const tr_event_t & event);
