// SPDX-License-Identifier: MIT
#ifndef GROWTH_FOREIGN_H
#define GROWTH_FOREIGN_H

namespace growth
{

// Makes of a packed buffer with one table, whose columns are numbers of 64 bits and strings, what a machine of the other
// byte order would have sent. docs/PACKED-FORMAT.md tells the buffer.
void turn_to_foreign_order(char * p_buffer);

} // namespace growth

#endif
