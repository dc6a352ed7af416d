// SPDX-License-Identifier: MIT
// Copies and moves from each kind of source to each kind of target, by handle and by name, with and without overwrite:
// the code, and what stands at both places afterwards.
#include "whole/places.h"

namespace kt_test
{

namespace
{

enum class source_is { transient, transient_hashed, transient_waiting, open_file, open_hashed_file, file_only };
enum class target_is { absent, there, open, open_and_hashed };

struct matrix_case {
    source_is source;
    target_is target;
    bool      target_is_mounted;
    bool      moves;
    bool      by_handle;
    bool      overwrites;
};

bool has_handle(source_is source)
{
    return source != source_is::transient_waiting && source != source_is::file_only;
}

bool has_file(source_is source)
{
    return source == source_is::open_file || source == source_is::open_hashed_file || source == source_is::file_only;
}

std::vector<matrix_case> all_cases()
{
    std::vector<matrix_case> cases;
    for (const source_is source : {source_is::transient, source_is::transient_hashed, source_is::transient_waiting,
                                   source_is::open_file, source_is::open_hashed_file, source_is::file_only})
        for (const target_is target :
             {target_is::absent, target_is::there, target_is::open, target_is::open_and_hashed})
            for (const bool mounted : {false, true})
                for (const bool moves : {false, true})
                    for (const bool by_handle : {false, true})
                        for (const bool overwrites : {false, true})
                            if (!by_handle || has_handle(source))
                                cases.push_back({source, target, mounted, moves, by_handle, overwrites});
    return cases;
}

std::string name_of(const ::testing::TestParamInfo<matrix_case> & info)
{
    const matrix_case &       c = info.param;
    static const char * const sources[]{"a_transient_table", "a_hashed_transient_table", "a_waiting_transient_table",
                                        "an_open_file",      "an_open_hashed_file",      "a_file"};
    static const char * const targets[]{"that_is_free", "that_is_taken", "that_is_open", "that_is_open_and_hashed"};
    return std::string(c.moves ? "moving_" : "copying_") + sources[static_cast<int>(c.source)] +
           (c.by_handle ? "_by_handle" : "_by_name") + (c.target_is_mounted ? "_to_a_mounted_path_" : "_to_a_path_") +
           targets[static_cast<int>(c.target)] + (c.overwrites ? "_with_overwrite" : "_without_overwrite");
}

const rows source_rows{{1, 10}, {2, 20}, {3, 30}};
const rows target_rows{{7, 70}};

class copy_and_move_matrix : public ::testing::TestWithParam<matrix_case>, public places
{
  public:
    const matrix_case & c           = GetParam();
    const std::string   source_path = has_file(c.source) ? "/r/source" : "/source";
    const std::string   target_path = c.target_is_mounted ? "/r/target" : "/target";
    rg_opaque_handle_t  source      = nullptr;
    rg_opaque_handle_t  target      = nullptr;

    void set_up()
    {
        const bool hashed = c.source == source_is::transient_hashed || c.source == source_is::open_hashed_file;
        source            = create(source_path, source_rows, RG_MODE_WRITE, hashed);
        if (!has_handle(c.source)) {
            EXPECT_EQ(rg_close_table_1(std::exchange(source, nullptr)), 0);
        }
        if (c.target == target_is::absent)
            return;
        target = create(target_path, target_rows, RG_MODE_WRITE, c.target == target_is::open_and_hashed);
        if (c.target == target_is::there) {
            EXPECT_EQ(rg_close_table_1(std::exchange(target, nullptr)), 0);
        }
    }
    kt_int32_t call()
    {
        const kt_int32_t overwrite = c.overwrites ? 1 : 0;
        if (c.by_handle)
            return c.moves ? move_by_handle(source, target_path, overwrite)
                           : copy_by_handle(source, target_path, overwrite);
        return c.moves ? move_by_name(tree, source_path, target_path, overwrite)
                       : copy_by_name(tree, source_path, target_path, overwrite);
    }
    // Whether the target gets the source's rows.
    bool is_done() const { return c.target == target_is::absent || c.overwrites; }
    // A mounted target that is open with a hash table forgets that the work failed.
    kt_int32_t expected_code() const
    {
        const bool forgotten = c.target_is_mounted && c.target == target_is::open_and_hashed;
        return is_done() || forgotten ? 0 : RG_E_TABLE_EXISTS;
    }
    bool moves_the_object() const { return c.moves && !c.target_is_mounted && c.source != source_is::file_only; }
    void check_target()
    {
        const rows & expected = is_done() ? source_rows : target_rows;
        EXPECT_EQ(rows_at(target_path), expected);
        // The handles on a target in memory that was overwritten dangle.
        if (target != nullptr && (c.target_is_mounted || !is_done())) {
            EXPECT_EQ(rows_by_id(target), expected);
        }
    }
    void check_source()
    {
        const bool gone = c.moves && is_done();
        EXPECT_EQ(code_at(source_path), gone ? RG_E_NO_SUCH_TABLE : 0);
        if (has_file(c.source)) {
            EXPECT_EQ(file_exists(dir.file("source")), !gone);
        }
        if (!gone) {
            EXPECT_EQ(rows_at(source_path), source_rows);
        }
        if (source != nullptr) {
            EXPECT_EQ(rows_by_id(source), source_rows) << "a handle on the source stays good";
        }
    }
    // What is done to a copy doesn't reach the source, and the other way round.
    void check_independence()
    {
        if (source == nullptr || moves_the_object() || !is_done() || (c.target_is_mounted && target != nullptr))
            return;
        rg_opaque_handle_t copy = open_table(tree, target_path, RG_MODE_WRITE);
        ASSERT_NE(copy, nullptr);
        EXPECT_NE(copy, source);
        EXPECT_EQ(add(copy, 8, 80), 0);
        EXPECT_EQ(add(source, 9, 90), 0);
        EXPECT_EQ(rows_by_id(copy), (rows{{1, 10}, {2, 20}, {3, 30}, {8, 80}}));
        EXPECT_EQ(rows_by_id(source), (rows{{1, 10}, {2, 20}, {3, 30}, {9, 90}}));
        EXPECT_EQ(rg_close_table_1(copy), 0);
    }
};

} // namespace

TEST_P(copy_and_move_matrix, gives_the_code_and_the_states_told)
{
    set_up();
    const size_t descriptors = open_descriptors();
    EXPECT_EQ(call(), expected_code());
    EXPECT_EQ(error_code(), expected_code());
    EXPECT_FALSE(file_exists(dir.file("target.rewrite")));
    // Only the lock file may have stayed, closed: a moved or refreshed table has as many descriptors as before. A
    // target with a file that is overwritten in memory doesn't occur here.
    EXPECT_EQ(open_descriptors(), descriptors);
    check_target();
    check_source();
    check_independence();
    if (moves_the_object() && is_done() && source != nullptr) {
        EXPECT_EQ(open_table(tree, target_path, RG_MODE_WRITE), source) << "the object itself has moved";
        EXPECT_EQ(rg_close_table_1(source), 0);
    }
    if (source != nullptr) {
        EXPECT_EQ(rg_close_table_1(source), 0);
    }
    if (target != nullptr && (c.target_is_mounted || !is_done())) {
        EXPECT_EQ(rg_close_table_1(target), 0);
    }
}

INSTANTIATE_TEST_SUITE_P(all, copy_and_move_matrix, ::testing::ValuesIn(all_cases()), name_of);

} // namespace kt_test
