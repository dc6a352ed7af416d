// SPDX-License-Identifier: MIT
// The set of application binaries: each element's applied and committed version through set, delete, commit and abort.
#include "rg_i_application_metadata.h"

#include <gtest/gtest.h>

#include <cstdarg>
#include <cstdlib>
#include <string>
#include <vector>

#include "support/allocations.h"

using namespace kt_test;

namespace
{

class metadata_set
{
  public:
    explicit metadata_set(kt_uint32_t max_elements = 1)
    {
        EXPECT_EQ(rg_i_allocate_application_metadata_buffer(max_elements, &p_set_), 0);
    }
    explicit metadata_set(rg_i_application_metadata_t * p_set) : p_set_(p_set) {}
    ~metadata_set() { EXPECT_EQ(rg_i_free_application_metadata(p_set_), 0); }
    metadata_set(const metadata_set &)             = delete;
    metadata_set & operator=(const metadata_set &) = delete;

    rg_i_application_metadata_t * operator->() const { return p_set_; }
    rg_i_application_metadata_t * get() const { return p_set_; }

    kt_int32_t add(kt_uint32_t type, const std::string & data)
    {
        return rg_i_add_application_metadata_element(p_set_, type, static_cast<kt_uint32_t>(data.size()), text(data));
    }
    kt_int32_t set(kt_uint32_t type, const std::string & data)
    {
        return rg_i_set_application_metadata_element(p_set_, type, static_cast<kt_uint32_t>(data.size()), text(data));
    }
    kt_int32_t put(kt_uint32_t type, const std::string & data)
    {
        return rg_i_set_application_metadata(p_set_, type, static_cast<kt_uint32_t>(data.size()), text(data));
    }
    kt_int32_t remove(kt_uint32_t type) { return rg_i_delete_application_metadata_element(p_set_, type); }
    void       commit() { EXPECT_EQ(rg_i_commit_application_metadata_buffer_updates(p_set_), 0); }
    void       abort() { EXPECT_EQ(rg_i_abort_application_metadata_buffer_updates(p_set_), 0); }

    // The bytes that a reader gets, or the code in angle brackets.
    std::string read(kt_uint32_t type, kt_uint32_t visible) const
    {
        kt_uint32_t      length = 0;
        kt_char_ptr_t    p_data = nullptr;
        const kt_int32_t rc     = rg_i_get_application_metadata_element(p_set_, type, visible, &length, &p_data);
        if (rc != 0) {
            EXPECT_EQ(error_code(), rc);
            EXPECT_EQ(p_data, nullptr);
            return "<" + std::to_string(rc) + ">";
        }
        std::string result(p_data, length);
        std::free(p_data);
        return result;
    }
    std::string applied(kt_uint32_t type) const { return read(type, 1); }
    std::string committed(kt_uint32_t type) const { return read(type, 0); }

    std::vector<kt_uint32_t> types() const
    {
        std::vector<kt_uint32_t> result;
        for (kt_uint32_t i = 0; i < p_set_->total_elements; ++i)
            result.push_back(p_set_->p_index[i].type);
        return result;
    }

  private:
    rg_i_application_metadata_t * p_set_ = nullptr;
};

using types = std::vector<kt_uint32_t>;

kt_int32_t set_many(metadata_set & set, kt_uint32_t count, ...)
{
    va_list ap;
    va_start(ap, count);
    const kt_int32_t rc = rg_i_set_application_metadata_v(set.get(), count, ap);
    va_end(ap);
    return rc;
}

} // namespace

TEST(application_metadata, starts_empty_and_closes_when_null)
{
    metadata_set set(3);
    EXPECT_EQ(set->max_elements, 3u);
    EXPECT_EQ(set->total_elements, 0u);
    EXPECT_EQ(rg_i_free_application_metadata(nullptr), 0);
}

TEST(application_metadata, keeps_its_elements_ascending_by_type)
{
    metadata_set set;
    for (const kt_uint32_t type : {5u, 1u, 0xFFFFFFFFu, 3u, 0u})
        ASSERT_EQ(set.add(type, std::to_string(type)), 0);
    EXPECT_EQ(set.types(), (types{0, 1, 3, 5, 0xFFFFFFFFu}));
    EXPECT_EQ(set->max_elements, 8u) << "doubled as often as needed";
    for (const kt_uint32_t type : set.types())
        EXPECT_EQ(set.applied(type), std::to_string(type));
    EXPECT_EQ(set.applied(2), "<202>");
    EXPECT_EQ(set.applied(6), "<202>");
}

TEST(application_metadata, refuses_an_add_of_a_type_that_exists_even_with_its_deletion_pending)
{
    metadata_set set;
    ASSERT_EQ(set.add(4, "a"), 0);
    EXPECT_EQ(set.add(4, "b"), RG_E_DUPLICATE_KEY);
    EXPECT_EQ(error_code(), RG_E_DUPLICATE_KEY);
    set.commit();
    ASSERT_EQ(set.remove(4), 0);
    EXPECT_EQ(set.add(4, "b"), RG_E_DUPLICATE_KEY);
    ASSERT_EQ(set.set(4, "b"), 0) << "setting revives it";
    EXPECT_EQ(set.applied(4), "b");
    EXPECT_EQ(set.committed(4), "a");
}

TEST(application_metadata, not_found_is_202_with_the_text_of_a_missing_key)
{
    metadata_set set;
    EXPECT_EQ(set.set(1, "x"), RG_E_NO_SUCH_KEY);
    EXPECT_EQ(error_message_index(), 19);
    EXPECT_EQ(set.remove(1), RG_E_NO_SUCH_KEY);
    EXPECT_EQ(error_message_index(), 19);
    EXPECT_EQ(set.applied(1), "<202>");
    EXPECT_EQ(error_message_index(), 19);
}

TEST(application_metadata, set_twice_before_a_commit_frees_the_first_pending_version_and_keeps_the_committed_one)
{
    metadata_set set;
    ASSERT_EQ(set.add(0, "old"), 0);
    set.commit();
    ASSERT_EQ(set.set(0, "first"), 0);
    ASSERT_EQ(set.set(0, "second"), 0);
    EXPECT_EQ(set.applied(0), "second");
    EXPECT_EQ(set.committed(0), "old");
    set.abort();
    EXPECT_EQ(set.applied(0), "old");
    EXPECT_EQ(set->p_index[0].p_applied, set->p_index[0].p_committed);
}

TEST(application_metadata, new_elements_are_visible_as_applied_alone)
{
    metadata_set set;
    ASSERT_EQ(set.add(0, "new"), 0);
    EXPECT_EQ(set.applied(0), "new");
    EXPECT_EQ(set.committed(0), "<202>");
    ASSERT_EQ(set.set(0, "newer"), 0);
    EXPECT_EQ(set.committed(0), "<202>");
    set.commit();
    EXPECT_EQ(set.committed(0), "newer");
}

TEST(application_metadata, deleted_elements_stay_until_the_commit)
{
    metadata_set set;
    ASSERT_EQ(set.add(0, "x"), 0);
    set.commit();
    ASSERT_EQ(set.remove(0), 0);
    EXPECT_EQ(set.applied(0), "<204>");
    EXPECT_EQ(set.committed(0), "x");
    ASSERT_EQ(set.remove(0), 0) << "once more is a success";
    set.abort();
    EXPECT_EQ(set.applied(0), "x");
    ASSERT_EQ(set.remove(0), 0);
    set.commit();
    EXPECT_EQ(set.types(), types{});
}

TEST(application_metadata, a_new_element_that_is_deleted_has_no_version_and_goes_with_commit_or_abort)
{
    for (const bool aborts : {false, true}) {
        metadata_set set;
        ASSERT_EQ(set.add(0, "x"), 0);
        ASSERT_EQ(set.remove(0), 0);
        EXPECT_EQ(set.types(), types{0});
        EXPECT_EQ(set.applied(0), "<204>");
        EXPECT_EQ(set.committed(0), "<202>");
        if (aborts)
            set.abort();
        else
            set.commit();
        EXPECT_EQ(set.types(), types{});
    }
}

TEST(application_metadata, aborting_removes_new_elements_and_commit_removes_deleted_ones_and_the_rest_moves_down)
{
    metadata_set set;
    for (kt_uint32_t type = 0; type < 6; ++type)
        ASSERT_EQ(set.add(type, std::string(type, 'c')), 0);
    set.commit();
    for (const kt_uint32_t type : {0u, 2u, 3u})
        ASSERT_EQ(set.remove(type), 0);
    set.commit();
    EXPECT_EQ(set.types(), (types{1, 4, 5}));
    EXPECT_EQ(set.committed(5), "ccccc");

    ASSERT_EQ(set.add(0, "n"), 0);
    ASSERT_EQ(set.add(9, "n"), 0);
    ASSERT_EQ(set.set(4, "changed"), 0);
    ASSERT_EQ(set.remove(5), 0);
    set.abort();
    EXPECT_EQ(set.types(), (types{1, 4, 5}));
    EXPECT_EQ(set.applied(4), "cccc");
    EXPECT_EQ(set.applied(5), "ccccc");
}

TEST(application_metadata, is_set_or_added)
{
    metadata_set set;
    ASSERT_EQ(set.put(0, "added"), 0);
    ASSERT_EQ(set.put(0, "set"), 0);
    EXPECT_EQ(set.applied(0), "set");
    EXPECT_EQ(set->total_elements, 1u);

    kt_uint32_t   length = 0;
    kt_char_ptr_t p_data = nullptr;
    ASSERT_EQ(rg_i_get_application_metadata(set.get(), 1, 0, &length, &p_data), 0);
    EXPECT_EQ(std::string(p_data, length), "set");
    std::free(p_data);
}

TEST(application_metadata, takes_several_elements_in_one_call)
{
    metadata_set set;
    ASSERT_EQ(set.add(2, "old"), 0);
    ASSERT_EQ(set_many(set, 3, 1u, 3u, text("one"), 2u, 3u, text("two"), 0u, 0u, text("")), 0);
    EXPECT_EQ(set.types(), (types{0, 1, 2}));
    EXPECT_EQ(set.applied(1), "one");
    EXPECT_EQ(set.applied(2), "two");
    EXPECT_EQ(set.applied(0), "");
}

TEST(application_metadata, several_elements_set_ahead_of_a_failure_stay_set)
{
    metadata_set  set(4);
    kt_char_ptr_t p_one = text("one");
    kt_char_ptr_t p_two = text("two");
    fault_scope   faults;
    fail_call(call::allocation, 2, ENOMEM);
    EXPECT_EQ(set_many(set, 2, 1u, 3u, p_one, 2u, 3u, p_two), RG_E_NO_MEMORY);
    EXPECT_EQ(error_code(), RG_E_NO_MEMORY);
    EXPECT_EQ(set.types(), types{1});
    reset_calls();
    // A set that fails below 202 ends it at once.
    fail_call(call::allocation, 1, ENOMEM);
    EXPECT_EQ(set_many(set, 2, 1u, 3u, p_two, 2u, 3u, p_two), RG_E_NO_MEMORY);
    EXPECT_EQ(set.types(), types{1});
    reset_calls();
    EXPECT_EQ(set.applied(1), "one");
}

TEST(application_metadata, without_bytes_for_its_length_is_refused)
{
    metadata_set set;
    EXPECT_EQ(rg_i_set_application_metadata(set.get(), 0, 3, nullptr), RG_E_NULL_POINTER);
    EXPECT_EQ(set->total_elements, 0u);
    EXPECT_EQ(rg_i_set_application_metadata(set.get(), 0, 0, nullptr), 0);
    EXPECT_EQ(set.applied(0), "");
}

TEST(application_metadata, grows_from_a_capacity_of_zero_to_one)
{
    metadata_set set(0u);
    ASSERT_EQ(set.add(7, "x"), 0);
    EXPECT_EQ(set->max_elements, 1u);
    ASSERT_EQ(set.add(6, "y"), 0);
    EXPECT_EQ(set->max_elements, 2u);
    EXPECT_EQ(set.types(), (types{6, 7}));
}

TEST(application_metadata, that_cant_grow_keeps_its_index_and_releases_the_new_version)
{
    metadata_set set;
    ASSERT_EQ(set.add(1, "kept"), 0);
    fault_scope faults;
    fail_call(call::allocation, 2, ENOMEM); // behind the version
    EXPECT_EQ(set.add(2, "x"), RG_E_NO_MEMORY);
    EXPECT_EQ(error_code(), RG_E_NO_MEMORY);
    EXPECT_EQ(set->max_elements, 1u);
    EXPECT_EQ(set.types(), types{1});
    reset_calls();
    EXPECT_EQ(set.applied(1), "kept");
    ASSERT_EQ(set.add(2, "x"), 0);
}

TEST(application_metadata, without_memory_is_as_it_was_in_every_operation)
{
    metadata_set set;
    ASSERT_EQ(set.add(0, "committed"), 0);
    set.commit();
    fail_each_allocation([&] { return set.set(0, "pending"); },
                         [&](kt_int32_t rc) {
                             EXPECT_EQ(set.applied(0), rc == 0 ? "pending" : "committed");
                             EXPECT_EQ(set.committed(0), "committed");
                         });
    fail_each_allocation([&] { return set.add(1, "new"); },
                         [&](kt_int32_t rc) { EXPECT_EQ(set->total_elements, rc == 0 ? 2u : 1u); });
    fail_each_allocation([&] {
        kt_binary_ptr_t  p_binary = nullptr;
        const kt_int32_t rc       = rg_i_get_application_metadata_element_binary(set.get(), 0, 1, &p_binary);
        EXPECT_EQ(p_binary != nullptr, rc == 0);
        std::free(p_binary);
        return rc;
    });
    rg_i_application_metadata_t * p_other = nullptr;
    fail_each_allocation([&] { return rg_i_allocate_application_metadata_buffer(2, &p_other); });
    rg_i_free_application_metadata(p_other);
}

TEST(a_copy_of_application_metadata, has_the_committed_state_and_nothing_pending)
{
    metadata_set set;
    ASSERT_EQ(set.add(1, "one"), 0);
    ASSERT_EQ(set.add(2, "two"), 0);
    set.commit();
    ASSERT_EQ(set.set(1, "pending"), 0);
    ASSERT_EQ(set.add(3, "new"), 0);
    ASSERT_EQ(set.remove(2), 0);

    rg_i_application_metadata_t * p_copy = nullptr;
    fail_each_allocation([&] { return rg_i_duplicate_application_metadata_buffer(set.get(), &p_copy); },
                         [&](kt_int32_t rc) { EXPECT_EQ(p_copy != nullptr, rc == 0); });
    metadata_set copy(p_copy);
    EXPECT_EQ(copy->max_elements, set->max_elements);
    EXPECT_EQ(copy.types(), (types{1, 2}));
    for (const kt_uint32_t type : {1u, 2u}) {
        EXPECT_EQ(copy.applied(type), set.committed(type));
        EXPECT_EQ(copy.committed(type), set.committed(type));
    }
    EXPECT_EQ(set.applied(1), "pending") << "the source is as it was";
}
