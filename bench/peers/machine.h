// SPDX-License-Identifier: MIT
#ifndef PEERS_MACHINE_H
#define PEERS_MACHINE_H

#include <sys/types.h>

#include "groups.h"

namespace peers
{

// A file that is synced as a table file is by a transaction of one row. Removed in the end.
class fsync_file
{
  public:
    explicit fsync_file(const std::string & path);
    ~fsync_file();
    fsync_file(const fsync_file &)             = delete;
    fsync_file & operator=(const fsync_file &) = delete;

    // A row's record and a commit record are written behind the end, and synced; then the commit record ahead of them is
    // switched off, and that is synced.
    void append_pair();
    // The same where something has been written before.
    void overwrite_pair();

  private:
    void pair(off_t rows_at, off_t mark_at);

    std::string path_;
    int         fd_;
    off_t       end_ = 0;
};

} // namespace peers

#endif
