// SPDX-License-Identifier: MIT
// hold: what other processes hold. A process that has a table open for writing holds a lock on its file, and one that
// copies or moves a table into a directory holds the directory's lock file too. The library waits for both without an
// end; ktrg asks first, and waits as long as the user says.
#pragma once

#include <string>

#include "place.h"

namespace ktrg
{

// Waits until no other process has the table open for writing. Throws the failure of exit code 5 after so many seconds,
// and that of a table that isn't there or may not be written.
void wait_while_held(const place & where, double wait_seconds);

// Waits until a table can be put at the place, whether there is one or not: until no other process holds the table or
// copies into its directory.
void wait_for_target(const place & where, double wait_seconds);

// Waits until no other process copies or moves tables into the place's directory. For one who holds the table itself, whose
// lock would go if its file were opened here.
void wait_for_directory(const place & where, double wait_seconds);

// Holds the lock of a file's writer, if the file is there, until it goes. Throws the failure of exit code 5 if another
// process has it.
class file_hold
{
  public:
    file_hold(const std::string & file, const std::string & subject);
    ~file_hold();
    file_hold(const file_hold &)             = delete;
    file_hold & operator=(const file_hold &) = delete;

  private:
    int fd_ = -1;
};

} // namespace ktrg
