// SPDX-License-Identifier: MIT
// ku_catalog: the translated text of a message, if there is one. Internal to the utility library.
#pragma once

#include "kt_types.h"

// The text of the message in the catalog that the locale's messages category asks for, or the default text: when the
// locale is C/POSIX, when there is no such catalog or message, and when the catalog's text doesn't take the very
// arguments that the default text takes. The text lives as long as the process.
const kt_char_t * ku_catalog_text(const kt_char_t * p_catalog, kt_int32_t set, kt_int32_t message_index,
                                  const kt_char_t * p_default_text);

// Whether both texts take the same arguments with the same types, so that one may stand for the other in a printf.
bool ku_conversions_match(const kt_char_t * p_text, const kt_char_t * p_default_text);
