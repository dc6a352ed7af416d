// SPDX-License-Identifier: MIT
// arena: the stores of one run, side by side, and how they are timed.
//
// Repetitions are interleaved: each is done by all stores before the next begins, and the store that begins changes, so
// that what disturbs the machine for a while disturbs them all. Figures without file work are the thread's processor
// time, others are wall time.
#ifndef PEERS_ARENA_H
#define PEERS_ARENA_H

#include <cstddef>
#include <filesystem>
#include <functional>
#include <initializer_list>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "common/clock.h"
#include "results.h"
#include "store.h"

namespace peers
{

struct options {
    std::string              directory;
    std::vector<std::size_t> sizes{1'000, 10'000, 100'000, 1'000'000};
    std::vector<std::string> stores;    // empty: all
    std::vector<std::string> workloads; // empty: all
    int                      repeat       = 5;
    double                   slice        = 0.03; // seconds that a repetition of a short call goes on
    double                   patience     = 30;   // a store that would need more seconds for something long is left out
    int                      transactions = 40;   // durable ones in a repetition
    // Ten rounds of updates are for so many rows or fewer: bytes a row are the same from some size on, and millions of
    // updates take a while.
    std::size_t most_updated = 100'000;
};

// One store that takes part.
struct contestant {
    const store_kind *     p_kind;
    std::string            directory;
    std::unique_ptr<store> p_store;
    bool                   loaded = false; // its directory has the data set
    std::size_t            at     = 0;     // where in the shuffled keys its next read starts
};

class arena
{
  public:
    arena(options o, results & figures);
    ~arena(); // removes all files
    arena(const arena &)             = delete;
    arena & operator=(const arena &) = delete;

    // What follows is about so many rows.
    void begin(const data_set & data) { p_data_ = &data; }

    [[nodiscard]] const data_set &    data() const { return *p_data_; }
    [[nodiscard]] const options &     chosen() const { return options_; }
    [[nodiscard]] const std::string & directory() const { return directory_; }

    // Whether any of these is to be measured.
    [[nodiscard]] bool wants(std::initializer_list<std::string_view> workloads) const;

    // Makes each store anew, with all rows in it, and leaves it open for writing. One that would take too long stays out.
    void load(layout found_by);
    void reopen(layout found_by, access how = access::read); // those that were loaded
    void close();
    void clear(); // closes them and removes their files

    // Makes this store anew, without rows.
    void                open_fresh(contestant & c, layout found_by);
    [[nodiscard]] place place_of(const contestant & c, layout found_by) const;

    // Whether a store can be expected to do something in time, from how long it took with fewer rows; notes it if not.
    bool expects_in_time(const contestant & c, const std::string & what);
    void took(const contestant & c, const std::string & what, double seconds);

    // Repeats an action that takes long. A store that has worked for some time at it begins no other repetition, and one
    // that can't be expected to do it in time doesn't begin at all.
    void repeat_long(const std::string & what, const std::function<void(contestant &)> & action);

    // Calls action for each of the stores, or each that was loaded, in the order of repetition n.
    void each(int repetition, const std::function<void(contestant &)> & action);
    void each_loaded(int repetition, const std::function<void(contestant &)> & action);

    // Times an action, and adds what it cost per unit.
    template <class Action>
    void time(std::string_view workload, const contestant & c, clock_kind kind, std::size_t units, Action action)
    {
        const double seconds = seconds_of(kind, action);
        add(workload, c.p_kind->name, seconds * 1e9 / static_cast<double>(units));
    }
    void add(std::string_view workload, std::string_view store, double value);

    // Times call(contestant, n), which does something n times over, in slices of equal length on every store that was
    // loaded.
    void measure_calls(std::string_view workload, std::size_t units,
                       const std::function<void(contestant &, std::size_t)> & call);

  private:
    using history = std::vector<std::pair<std::size_t, double>>; // rows and seconds

    options                                                options_;
    results &                                              results_;
    std::string                                            directory_;
    const data_set *                                       p_data_ = nullptr;
    std::vector<contestant>                                contestants_;
    std::map<std::pair<std::string, std::string>, history> histories_;
};

} // namespace peers

#endif
