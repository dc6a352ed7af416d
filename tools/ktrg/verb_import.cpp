// SPDX-License-Identifier: MIT
// ktrg import: rows of a text file into a table.
//
// Without --batch it is one transaction: a value that doesn't fit, a key that exists or an interrupt leaves the table as
// it was, and a table that was to be created doesn't stay. With --batch N each N rows are one, and what fails later
// leaves those in front of it. With --rejects a row that can't be had is put aside, and the others go in.
#include <fmt/format.h>

#include "import_rows.h"
#include "interrupt.h"
#include "place.h"

namespace ktrg
{

namespace
{

on_conflict conflicts_of(const import_options & options)
{
    return options.on_conflict == "update" ? on_conflict::update
           : options.on_conflict == "skip" ? on_conflict::skip
                                           : on_conflict::refuse;
}

table open_target(const common_options & common, const import_options & options, const place & where,
                  const input & from)
{
    if (!options.create)
        return table::open_for_writing(where, common.wait_seconds);
    const std::vector<column> columns = new_columns(common, options, where, from);
    (void)input_columns(where, from, columns); // refuses what the table would be made in vain for
    // A dry run goes through all of it in memory.
    return common.dry_run ? table::create_in_memory(where, columns, from.count())
                          : table::create(where, columns, from.count());
}

void refuse_wrong_options(const import_options & options, const place & where)
{
    if (!options.create && (!options.types.empty() || !options.key.empty()))
        throw failure(exit_code::usage, where.name, "--key and --types go with --create");
}

// Failures that are the row's own; anything else would meet the next row too.
bool is_of_the_row(const failure & what)
{
    return what.exit() == exit_code::usage || what.exit() == exit_code::conflict ||
           what.exit() == exit_code::not_permitted;
}

class import_run
{
  public:
    import_run(const common_options & common, const import_options & options, const input & from, table & to)
        : common_(common), options_(options), from_(from), to_(to), rejects_(common, options, from),
          importer_(common, from, to, conflicts_of(options))
    {
    }

    void run()
    {
        for (std::size_t row = from_.first_row; row < from_.rows.size(); row++) {
            stop_if_interrupted();
            import(row);
            if (options_.batch != 0 && imported() - committed_ == options_.batch)
                commit();
        }
        rejects_.finish();
        if (imported() != committed_)
            commit();
    }

    // Rows that are in the table, whatever happens now.
    [[nodiscard]] std::size_t committed() const { return committed_; }
    [[nodiscard]] std::size_t rejected() const { return rejects_.count(); }

    void say_result() const
    {
        const std::string & name = to_.where().name;
        if (importer_.foreign_cells() != 0)
            say(fmt::format("{}: {} not UTF-8; the bytes are kept, and shown escaped", name,
                            counted(importer_.foreign_cells(), "cell is", "cells are")));
        const std::size_t rows = importer_.added();
        std::string       text = fmt::format("{}: {} {} {}", name, counted(rows, "row"),
                                       common_.dry_run ? "would be"
                                             : rows == 1     ? "was"
                                                             : "were",
                                       options_.create && !common_.dry_run ? "imported into a new table" : "imported");
        for (const auto & [count, p_word] :
             {std::pair(importer_.updated(), "updated"), std::pair(importer_.skipped(), "skipped"),
              std::pair(rejects_.count(), "rejected")})
            if (count != 0)
                text += fmt::format(", {} {}", count, p_word);
        say(text);
        if (rejects_.count() != 0 && !common_.dry_run)
            say(fmt::format("{}: the rejected rows and the reasons are in {}", name, options_.rejects));
    }

  private:
    void import(std::size_t row)
    {
        try {
            importer_.import(row);
        } catch (const failure & what) {
            if (!rejects_.wanted() || !is_of_the_row(what))
                throw;
            rejects_.add(row, what);
        }
    }

    [[nodiscard]] std::size_t imported() const { return importer_.added() + importer_.updated(); }

    void commit()
    {
        if (!common_.dry_run)
            to_.commit();
        committed_ = imported();
    }

    const common_options & common_;
    const import_options & options_;
    const input &          from_;
    table &                to_;
    reject_file            rejects_;
    row_importer           importer_;
    std::size_t            committed_ = 0;
};

// Some rows are in by earlier batches: that is told, and an interrupt stays an interrupt.
failure with_committed(const failure & what, std::size_t committed)
{
    const bool        interrupted = what.exit() == exit_code::interrupted;
    const std::string text        = interrupted ? "interrupted" : what.text();
    return failure(interrupted ? what.exit() : exit_code::done_in_part, what.subject(),
                   fmt::format("{}; {} in by earlier batches", text, counted(committed, "row is", "rows are")),
                   what.code());
}

} // namespace

exit_code run_import(const common_options & common, const import_options & options)
{
    const place where = find_place(options.table);
    refuse_wrong_options(options, where);
    note_interrupts();
    const input from      = read_input(common, options, where);
    table       to        = open_target(common, options, where, from);
    const bool  fresh     = options.create && !common.dry_run;
    std::size_t committed = 0;
    try {
        import_run work(common, options, from, to);
        try {
            work.run();
        } catch (const failure & what) {
            committed = common.dry_run ? 0 : work.committed();
            if (committed == 0)
                throw;
            throw with_committed(what, committed);
        }
        to.close();
        if (!common.quiet)
            work.say_result();
        return work.rejected() != 0 ? exit_code::done_in_part : exit_code::done;
    } catch (...) {
        if (fresh && committed == 0)
            to.remove();
        throw;
    }
}

} // namespace ktrg
