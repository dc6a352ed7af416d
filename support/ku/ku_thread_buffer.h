// SPDX-License-Identifier: MIT
// ku_thread_buffer: room for the texts of each thread. Internal to the utility library.
#pragma once

#include <cstddef>

// Where the texts of a thread's last failures stand until its next ones.
struct ku_thread_buffer_t {
    static constexpr size_t message_size   = 12 * 1024; // two paths of 4 KiB and the longest message around them
    static constexpr size_t catalog_size   = 128;
    static constexpr size_t diagnosis_size = 1024;

    char message[message_size];
    char catalog[catalog_size];
    char diagnosis[diagnosis_size]; // of the last expression that was refused
};

// The calling thread's buffer, made on the first call; NULL if the system has no page left.
ku_thread_buffer_t * ku_thread_buffer();

// Whether it has been made and not yet been given back.
bool ku_thread_has_buffer();

// Ends a text that didn't fit in front of the last character that isn't whole, at most room - 1 bytes behind its start.
// Returns where the terminator was put.
size_t ku_end_at_character(char * p_text, size_t room);
