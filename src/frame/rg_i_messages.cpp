// SPDX-License-Identifier: MIT
// rg_i_messages: the built-in texts, which stand where no catalog is found for the locale.
//
// Layer: frame, at the bottom: calls nothing. The table is part of the interface, and nothing here ever writes to it.
#include "rg_i_messages.h"

// The interface gives the entries as char pointers; they lead to constant text.
kt_char_ptr_t ku_mesgtbl_kt_rg_set[RG_TOTAL_MESSAGES] = {
#define MESSAGE(index, code, text) const_cast<kt_char_ptr_t>(text),
#include "rg_i_messages.inc"
#undef MESSAGE
};

const kt_char_t ku_badid_kt_rg_set[] = "Bad message id for message set kt_rg_set";
