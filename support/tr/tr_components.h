// SPDX-License-Identifier: MIT
// tr_components: who is registered, and whether anybody wants events. Internal to the trace library.
#pragma once

#include <atomic>

#include "kt_tr.h"

// Why an event may have to be recorded. 0: it is dropped at once.
enum { TR_I_LEVELS_WERE_SET = 1, TR_I_SINK_IS_SET = 2 };
extern std::atomic<kt_uint32_t> Tr_I_Wanted;

// Whether a component of this name has any non-zero level.
bool tr_i_component_is_traced(const kt_char_t * p_component);
