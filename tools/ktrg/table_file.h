// SPDX-License-Identifier: MIT
// table_file: a look into a table's file, record by record, independently of the library's replay.
//
// `ls`, `schema` and `stat` need what an open table doesn't tell: where the bytes of the file go. The reader follows
// docs/FILE-FORMAT.md. It takes no lock and reads with bounded memory: a word for each row record. It never runs past
// the file, and answers a file that isn't sound with a failure of exit code 4.
//
// Never use it on a table that this process has open for writing: closing any descriptor of a file gives up all locks
// that the process holds on it.
#pragma once

#include <cstdint>
#include <ctime>
#include <string>
#include <vector>

#include "columns.h"

namespace ktrg
{

// Bytes of the file by what they are worth. They add up to the file's length.
struct file_bytes {
    std::uint64_t metadata           = 0; // live: the columns
    std::uint64_t live_rows          = 0; // live: the rows as they stand
    std::uint64_t live_commit        = 0; // live: the commit record, with the application's blob
    std::uint64_t superseded_rows    = 0; // superseded: versions of rows that were updated
    std::uint64_t superseded_commits = 0; // superseded: commit records of earlier transactions
    std::uint64_t deleted_rows       = 0; // dead: versions of rows that are gone
    std::uint64_t deletion_lists     = 0; // dead: the records that say so
    std::uint64_t behind_commit      = 0; // dead: what an interrupted or aborted transaction left

    [[nodiscard]] std::uint64_t live() const { return metadata + live_rows + live_commit; }
    [[nodiscard]] std::uint64_t superseded() const { return superseded_rows + superseded_commits; }
    [[nodiscard]] std::uint64_t dead() const { return deleted_rows + deletion_lists + behind_commit; }
};

struct table_file {
    std::vector<column> columns;
    std::uint64_t       length       = 0;
    std::timespec       changed      = {};
    bool                big_endian   = false;
    std::uint64_t       rows         = 0;
    std::uint64_t       counter      = 0;
    std::uint64_t       transactions = 0; // commits since the file was last written whole
    std::uint64_t       updates      = 0; // row records that replace another
    std::uint64_t       deletions    = 0; // rows that deletion lists name
    std::uint64_t       blob_length  = 0;
    bool                has_blob     = false;
    file_bytes          bytes;
};

// Reads the columns alone, which costs no walk. Throws a failure with `name` as its subject.
[[nodiscard]] std::vector<column> read_table_columns(const std::string & path, const std::string & name);

// Reads it all.
[[nodiscard]] table_file read_table_file(const std::string & path, const std::string & name);

// Whether the file begins like a table: for listings of directories where other files lie too.
[[nodiscard]] bool looks_like_table(const std::string & path);

} // namespace ktrg
