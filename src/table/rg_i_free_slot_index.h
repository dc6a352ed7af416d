// SPDX-License-Identifier: MIT
// rg_i_free_slot_index: which slots of a row index are free, as a set that finds the nearest free slot below another in
// a few steps, so that the free chain can stay sorted without being walked.
//
// One bit a slot, 64 to a word, and above each level of words one bit a word that isn't zero, up to a level of one
// word. The words lie behind the slots, in the allocation of the slots: they move, and are exchanged, with them. They
// know nothing of the chain: rg_i_table keeps the two in step. Nothing here fails or allocates.
#pragma once

#include <cstddef>

#include "kt_types.h"

inline constexpr kt_uint32_t RG_I_NO_SLOT = 0xFFFFFFFFu;

// Words that the set takes for so many slots.
[[nodiscard]] size_t rg_i_free_slot_index_words(kt_uint32_t total_slots);

// Makes the set hold the slots from first_slot to the last one, and no others.
void rg_i_free_slot_index_fill(kt_uint64_t * p_words, kt_uint32_t total_slots, kt_uint32_t first_slot);

[[nodiscard]] bool rg_i_free_slot_index_contains(const kt_uint64_t * p_words, kt_uint32_t slot);
void               rg_i_free_slot_index_add(kt_uint64_t * p_words, kt_uint32_t total_slots, kt_uint32_t slot);
void               rg_i_free_slot_index_remove(kt_uint64_t * p_words, kt_uint32_t total_slots, kt_uint32_t slot);

// The highest slot of the set below this one, or RG_I_NO_SLOT.
[[nodiscard]] kt_uint32_t rg_i_free_slot_index_below(const kt_uint64_t * p_words, kt_uint32_t total_slots,
                                                     kt_uint32_t slot);
