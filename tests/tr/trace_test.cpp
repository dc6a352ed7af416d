// SPDX-License-Identifier: MIT
// Components, levels, events, sinks and trace files.
#include <gtest/gtest.h>

#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <functional>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "kt_tr.h"
#include "support/faults.h"
#include "support/registry.h"

namespace
{

tr_category_description_t api_and_errors[] = {{0, kt_test::text("API"), 0, 0}, {1, kt_test::text("Errors"), 0, 0}};

// A component of the test's own, since registrations last as long as the process.
struct component {
    std::string                     name;
    static inline unsigned          made = 0;
    static constexpr size_t         most = 100;
    static inline tr_detail_level_t room[most][2]; // outlives the test: it stays registered
    tr_detail_level_t *             levels = room[made % most];

    explicit component(const char * p_prefix = "T") : name(p_prefix + std::to_string(made++)) {}
    void register_it(const tr_category_description_t * p_categories = api_and_errors)
    {
        tr_register_component_1(name.c_str(), levels, p_categories, 2);
    }
};

struct seen_event {
    tr_event_kind_t          kind;
    std::string              component, function, file, text;
    kt_uint32_t              id, count, line;
    std::vector<kt_uint32_t> values;
    std::vector<std::string> strings;
    kt_uint64_t              nanoseconds, thread;
};

void collect(void * p_token, const tr_event_t * p)
{
    seen_event e{p->kind, p->p_component, p->p_function, p->p_source_file, p->p_text, p->id, p->count, p->line, {},
                 {},      p->nanoseconds, p->thread};
    if (p->kind == TR_EVENT_VALUES)
        e.values.assign(p->p_values, p->p_values + p->count);
    if (p->kind == TR_EVENT_STRINGS)
        e.strings.assign(p->p_strings, p->p_strings + p->count);
    static_cast<std::vector<seen_event> *>(p_token)->push_back(e);
}

class with_sink
{
  public:
    with_sink() { tr_set_sink_1(collect, &events); }
    ~with_sink() { tr_set_sink_1(nullptr, nullptr); }
    with_sink(const with_sink &)                         = delete;
    with_sink &             operator=(const with_sink &) = delete;
    std::vector<seen_event> events;
};

// What a child process that traces into a file leaves there. In a child, because a process chooses its file once.
std::string traced_to_file(const std::string & setting, const std::function<void()> & make_events)
{
    kt_test::temp_dir dir;
    const pid_t       child = fork();
    if (child == 0) {
        setenv("KT_TRACE_FILE", dir.file("trace").c_str(), 1);
        setenv("KT_TRACE", setting.c_str(), 1);
        make_events();
        _exit(0);
    }
    int status = -1;
    EXPECT_EQ(waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
    if (!kt_test::file_exists(dir.file("trace")))
        return "";
    const kt_test::bytes content = kt_test::read_file(dir.file("trace"));
    return std::string(content.begin(), content.end());
}

// The line without its time and thread.
std::string without_stamp(const std::string & line)
{
    const size_t first = line.find(' ');
    return line.substr(line.find(' ', first + 1) + 1);
}

TEST(registering, a_component_gets_its_default_levels)
{
    component                       c;
    const tr_category_description_t categories[] = {{0, kt_test::text("API"), 3, 0}, {1, kt_test::text("E"), 0, 0}};
    c.register_it(categories);
    EXPECT_EQ(c.levels[0], 3);
    EXPECT_EQ(c.levels[1], 0);
}

TEST(registering, a_second_registration_of_the_same_levels_changes_nothing)
{
    component c;
    c.register_it();
    ASSERT_EQ(tr_set_level_1(c.name.c_str(), "API", 7), 0);
    c.register_it();
    EXPECT_EQ(c.levels[0], 7);
}

TEST(registering, a_component_is_registered_twice_and_both_follow)
{
    component a, b;
    b.name = a.name;
    a.register_it();
    b.register_it();
    ASSERT_EQ(tr_set_level_1(a.name.c_str(), "Errors", 2), 0);
    EXPECT_EQ(a.levels[1], 2);
    EXPECT_EQ(b.levels[1], 2);
}

TEST(registering, the_environment_sets_levels)
{
    component a, b, c;
    setenv("KT_TRACE", (a.name + ":API=1,Errors=300;" + b.name + ":*=255;nobody:API=3").c_str(), 1);
    a.register_it();
    b.register_it();
    c.register_it();
    unsetenv("KT_TRACE");
    EXPECT_EQ(a.levels[0], 1);
    EXPECT_EQ(a.levels[1], 255);
    EXPECT_EQ(b.levels[0], 255);
    EXPECT_EQ(b.levels[1], 255);
    EXPECT_EQ(c.levels[0], 0);
    EXPECT_EQ(c.levels[1], 0);
}

TEST(registering, an_environment_in_no_known_form_sets_nothing)
{
    for (const char * p_form : {"", ";", ":", "=", "%", "%:", "%:API", "%:API=", "%:API=x", "%:=1", "%:API=-1",
                                "%:Nothing=1", "%API=1", "%:API =1", ":API=1", "%:API=1x"}) {
        component   c;
        std::string setting = p_form;
        if (const size_t at = setting.find('%'); at != std::string::npos)
            setting.replace(at, 1, c.name);
        setenv("KT_TRACE", setting.c_str(), 1);
        c.register_it();
        unsetenv("KT_TRACE");
        EXPECT_EQ(c.levels[0], 0) << setting;
        EXPECT_EQ(c.levels[1], 0) << setting;
    }
}

TEST(levels, are_set_by_category_or_for_all_and_never_below_the_minimum)
{
    component                       c;
    const tr_category_description_t categories[] = {{0, kt_test::text("API"), 0, 0},
                                                    {1, kt_test::text("Errors"), 5, 2}};
    c.register_it(categories);
    EXPECT_EQ(tr_set_level_1(c.name.c_str(), "API", 9), 0);
    EXPECT_EQ(c.levels[0], 9);
    EXPECT_EQ(c.levels[1], 5);
    EXPECT_EQ(tr_set_level_1(c.name.c_str(), "*", 0), 0);
    EXPECT_EQ(c.levels[0], 0);
    EXPECT_EQ(c.levels[1], 2);
    EXPECT_EQ(tr_set_level_1(c.name.c_str(), nullptr, 1000), 0);
    EXPECT_EQ(c.levels[0], 255);
    EXPECT_EQ(c.levels[1], 255);
    EXPECT_EQ(tr_set_level_1(c.name.c_str(), "*", 0), 0);
}

TEST(levels, cannot_be_set_for_what_is_not_there)
{
    component c;
    c.register_it();
    EXPECT_EQ(tr_set_level_1("nobody", "API", 1), TR_E_UNKNOWN_COMPONENT);
    EXPECT_EQ(tr_set_level_1(nullptr, "API", 1), TR_E_UNKNOWN_COMPONENT);
    EXPECT_EQ(tr_set_level_1(c.name.c_str(), "Nothing", 1), TR_E_UNKNOWN_CATEGORY);
    EXPECT_EQ(c.levels[0], 0);
}

TEST(a_sink, gets_each_kind_of_event)
{
    with_sink sink;
    tr_record_id_1("_RGA", 5);
    tr_record_values_32_1("_RGA", 6, 2, 17u, 0xFFFFFFFFu);
    tr_record_strings_1("_RGA", 120, 2, "key", "/table");
    tr_record_error_1("_RGA", 0, "rg_i_x", 312, "rg_i_x.cpp", 0);
    tr_record_fmt_string_1("_RGA", 0xFFFFFFFF, "DV|RET|%.3d|%u|%d", 41, 7u, 100);
    ASSERT_EQ(sink.events.size(), 5u);

    EXPECT_EQ(sink.events[0].kind, TR_EVENT_ID);
    EXPECT_EQ(sink.events[0].component, "_RGA");
    EXPECT_EQ(sink.events[0].id, 5u);
    EXPECT_EQ(sink.events[0].thread, static_cast<kt_uint64_t>(gettid()));
    EXPECT_GT(sink.events[0].nanoseconds, 0u);

    EXPECT_EQ(sink.events[1].kind, TR_EVENT_VALUES);
    EXPECT_EQ(sink.events[1].id, 6u);
    EXPECT_EQ(sink.events[1].values, (std::vector<kt_uint32_t>{17, 0xFFFFFFFF}));
    EXPECT_GE(sink.events[1].nanoseconds, sink.events[0].nanoseconds);

    EXPECT_EQ(sink.events[2].kind, TR_EVENT_STRINGS);
    EXPECT_EQ(sink.events[2].id, 120u);
    EXPECT_EQ(sink.events[2].strings, (std::vector<std::string>{"key", "/table"}));

    EXPECT_EQ(sink.events[3].kind, TR_EVENT_ERROR);
    EXPECT_EQ(sink.events[3].id, 0u);
    EXPECT_EQ(sink.events[3].function, "rg_i_x");
    EXPECT_EQ(sink.events[3].line, 312u);
    EXPECT_EQ(sink.events[3].file, "rg_i_x.cpp");

    EXPECT_EQ(sink.events[4].kind, TR_EVENT_FORMATTED);
    EXPECT_EQ(sink.events[4].id, 0xFFFFFFFF);
    EXPECT_EQ(sink.events[4].text, "DV|RET|041|7|100");
}

TEST(a_sink, gets_development_lines_without_any_level)
{
    component c;
    c.register_it();
    with_sink sink;
    tr_record_fmt_string_1(c.name.c_str(), 0xFFFFFFFF, "DV|%d", 1);
    ASSERT_EQ(sink.events.size(), 1u);
}

TEST(a_sink, gets_nothing_more_once_it_is_taken_away)
{
    std::vector<seen_event> events;
    tr_set_sink_1(collect, &events);
    tr_record_id_1("_RGA", 1);
    tr_set_sink_1(nullptr, nullptr);
    tr_record_id_1("_RGA", 3);
    EXPECT_EQ(events.size(), 1u);
}

TEST(a_sink, sees_neither_its_own_events_nor_a_change_of_itself)
{
    static int calls;
    calls = 0;
    tr_set_sink_1(
        [](void *, const tr_event_t *) {
            calls++;
            tr_record_id_1("_RGA", 99);
            tr_set_sink_1(nullptr, nullptr);
        },
        nullptr);
    tr_record_id_1("_RGA", 1);
    tr_record_id_1("_RGA", 3);
    tr_set_sink_1(nullptr, nullptr);
    EXPECT_EQ(calls, 2);
}

TEST(a_sink, gets_no_more_values_strings_and_text_than_fit)
{
    with_sink sink;
    tr_record_values_32_1("_RGA", 1, 70, 0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15, 16, 17, 18, 19, 20, 21,
                          22, 23, 24, 25, 26, 27, 28, 29, 30, 31, 32, 33, 34, 35, 36, 37, 38, 39, 40, 41, 42, 43, 44,
                          45, 46, 47, 48, 49, 50, 51, 52, 53, 54, 55, 56, 57, 58, 59, 60, 61, 62, 63, 64, 65, 66, 67,
                          68, 69);
    tr_record_fmt_string_1("_RGA", 0, "%s", std::string(5000, 'x').c_str());
    ASSERT_EQ(sink.events.size(), 2u);
    EXPECT_EQ(sink.events[0].values.size(), 64u);
    EXPECT_EQ(sink.events[0].values.back(), 63u);
    EXPECT_EQ(sink.events[1].text, std::string(2047, 'x'));
}

TEST(an_event, leaves_errno_alone)
{
    tr_set_sink_1([](void *, const tr_event_t *) { errno = EPIPE; }, nullptr);
    errno = EXDEV;
    tr_record_id_1("_RGA", 1);
    EXPECT_EQ(errno, EXDEV);
    tr_set_sink_1(nullptr, nullptr);
}

TEST(by_default, nothing_is_recorded)
{
    EXPECT_EQ(traced_to_file("",
                             [] {
                                 component c;
                                 c.register_it();
                                 tr_record_id_1(c.name.c_str(), 1);
                                 tr_record_fmt_string_1(c.name.c_str(), 0xFFFFFFFF, "DV|");
                                 tr_record_fmt_string_1("unregistered", 0xFFFFFFFF, "DV|");
                             }),
              "");
}

TEST(the_trace_file, receives_a_line_per_event)
{
    component                c("LINES");
    const std::string        n    = c.name;
    const std::string        text = traced_to_file(n + ":API=1", [&] {
        c.register_it();
        tr_record_id_1(n.c_str(), 5);
        tr_record_values_32_1(n.c_str(), 6, 2, 17, 204);
        tr_record_strings_1(n.c_str(), 120, 2, "a\nkey", nullptr);
        tr_record_error_1(n.c_str(), 0, "rg_i_x", 312, "rg_i_x.cpp", 0);
        tr_record_fmt_string_1(n.c_str(), 0xFFFFFFFF, "DV|%d", 7);
        tr_record_id_1("another", 5);
    });
    std::vector<std::string> lines;
    for (size_t at = 0; at < text.size();) {
        const size_t end = text.find('\n', at);
        ASSERT_NE(end, std::string::npos);
        lines.push_back(without_stamp(text.substr(at, end - at)));
        at = end + 1;
    }
    EXPECT_EQ(lines,
              (std::vector<std::string>{n + " id 5", n + " values 6: 17 204", n + " strings 120: \"a?key\" \"\"",
                                        n + " error 0: rg_i_x at rg_i_x.cpp:312", n + " text 4294967295: DV|7"}));
}

TEST(the_trace_file, gets_each_line_in_one_write_and_cut_at_4_kib)
{
    component         c("WRITES");
    const std::string text  = traced_to_file(c.name + ":*=1", [&] {
        c.register_it();
        tr_record_id_1(c.name.c_str(), 1); // opens the file
        kt_test::reset_calls();
        const std::string key(3000, 'k');
        tr_record_strings_1(c.name.c_str(), 120, 2, key.c_str(), key.c_str());
        if (kt_test::calls_made(kt_test::call::write) != 1)
            _exit(1);
        tr_record_id_1(c.name.c_str(), 3);
    });
    const size_t      first = text.find('\n'), second = text.find('\n', first + 1);
    EXPECT_EQ(second - first, 4096u);
    EXPECT_EQ(text.back(), '\n');
}

TEST(the_trace_file, is_appended_to)
{
    kt_test::temp_dir dir;
    kt_test::write_file(dir.file("trace"), {'o', 'l', 'd', '\n'});
    const pid_t child = fork();
    if (child == 0) {
        component c("APPEND");
        setenv("KT_TRACE_FILE", dir.file("trace").c_str(), 1);
        setenv("KT_TRACE", (c.name + ":*=1").c_str(), 1);
        c.register_it();
        tr_record_id_1(c.name.c_str(), 1);
        _exit(0);
    }
    int status = -1;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
    const kt_test::bytes content = kt_test::read_file(dir.file("trace"));
    EXPECT_EQ(std::string(content.begin(), content.begin() + 4), "old\n");
    EXPECT_GT(content.size(), 20u);
}

TEST(the_trace_file, that_cannot_be_opened_or_written_harms_nobody)
{
    const pid_t child = fork();
    if (child == 0) {
        component c("BROKEN");
        close(STDERR_FILENO);
        setenv("KT_TRACE_FILE", "/no/such/directory/trace", 1);
        setenv("KT_TRACE", (c.name + ":*=1").c_str(), 1);
        c.register_it();
        errno = EXDEV;
        tr_record_id_1(c.name.c_str(), 1);
        tr_record_id_1(c.name.c_str(), 3);
        _exit(errno == EXDEV ? 0 : 1);
    }
    int status = -1;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
}

TEST(the_trace_file, is_not_written_while_a_sink_is_set)
{
    component c("SINKFIRST");
    EXPECT_EQ(traced_to_file(c.name + ":*=1",
                             [&] {
                                 c.register_it();
                                 std::vector<seen_event> events;
                                 tr_set_sink_1(collect, &events);
                                 tr_record_id_1(c.name.c_str(), 1);
                                 tr_set_sink_1(nullptr, nullptr);
                                 if (events.size() != 1)
                                     _exit(1);
                             }),
              "");
}

TEST(threads_registering, several_threads_register_and_set_levels_at_once)
{
    std::vector<std::unique_ptr<component>> components;
    for (int i = 0; i < 8; i++)
        components.push_back(std::make_unique<component>("P"));
    std::vector<std::thread> threads;
    for (auto & p : components) {
        threads.emplace_back([&p, &components] {
            p->register_it();
            for (auto & other : components)
                tr_set_level_1(other->name.c_str(), "API", 4);
            EXPECT_EQ(tr_set_level_1(p->name.c_str(), "API", 4), 0);
        });
    }
    for (std::thread & t : threads)
        t.join();
    for (auto & p : components) {
        EXPECT_EQ(p->levels[0], 4);
        tr_set_level_1(p->name.c_str(), "*", 0);
    }
}

struct guarded_token {
    std::atomic<bool>     alive{true};
    std::atomic<unsigned> calls{0};
};

void counting_sink(void * p_token, const tr_event_t *)
{
    auto * p = static_cast<guarded_token *>(p_token);
    EXPECT_TRUE(p->alive);
    p->calls++;
}

TEST(threads_sinks, a_sink_that_was_replaced_is_no_longer_running)
{
    std::atomic<bool>        stop{false};
    std::vector<std::thread> threads;
    for (int i = 0; i < 3; i++) {
        threads.emplace_back([&stop] {
            while (!stop) {
                tr_record_id_1("_RGA", 1);
                tr_record_fmt_string_1("_RGA", 0xFFFFFFFF, "DV|%d", 1);
            }
        });
    }
    unsigned calls = 0;
    for (int round = 0; round < 200; round++) {
        auto p_token = std::make_unique<guarded_token>();
        tr_set_sink_1(counting_sink, p_token.get());
        std::this_thread::sleep_for(std::chrono::microseconds(50));
        tr_set_sink_1(nullptr, nullptr);
        p_token->alive = false;
        calls += p_token->calls;
    }
    stop = true;
    for (std::thread & t : threads)
        t.join();
    EXPECT_GT(calls, 0u);
}

TEST(threads_sinks, a_child_forked_amid_events_can_change_the_sink)
{
    static std::atomic<bool> in_sink, leave_sink;
    in_sink = leave_sink = false;
    tr_set_sink_1(
        [](void *, const tr_event_t *) {
            in_sink = true;
            while (!leave_sink)
                std::this_thread::yield();
        },
        nullptr);
    std::thread other([] { tr_record_id_1("_RGA", 1); });
    while (!in_sink)
        std::this_thread::yield();
    const pid_t child = fork();
    if (child == 0) {
        alarm(20); // a hang fails the test
        tr_set_sink_1(nullptr, nullptr);
        _exit(0);
    }
    int status = -1;
    EXPECT_EQ(waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
    leave_sink = true;
    other.join();
    tr_set_sink_1(nullptr, nullptr);
}

} // namespace
