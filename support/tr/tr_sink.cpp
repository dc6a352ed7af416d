// SPDX-License-Identifier: MIT
// tr_sink: the program's sink for events.
//
// Always holds: once tr_set_sink_1 has returned, no event is in the sink that was set before, nor will one get there,
// so its token may be freed. Every event counts itself in before it looks whether there is a sink; a change takes the
// sink away and waits until those who may have seen it have counted themselves out.
// Locking: Change_Mutex admits one change at a time. Events take no lock. A forked child starts with nobody counted in
// but its own thread, since the others aren't there to count themselves out.
// A sink may call whatever makes events: those are dropped. It may not change the sink.
#include "tr_components.h"
#include "tr_output.h"

#include <pthread.h>
#include <sys/syscall.h>
#include <time.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>

namespace
{

struct sink_choice {
    tr_sink_t * p_sink;
    void *      p_token;
};

sink_choice                Choice;           // written only while Current is NULL and nobody is counted in
std::atomic<sink_choice *> Current{nullptr}; // NULL: no sink is set
std::atomic<kt_uint32_t>   Events_Under_Way{0};
pthread_mutex_t            Change_Mutex            = PTHREAD_MUTEX_INITIALIZER;
pthread_once_t             Fork_Handlers_Are_There = PTHREAD_ONCE_INIT;

__attribute__((tls_model("initial-exec"))) thread_local constinit bool In_Delivery = false;

void before_fork()
{
    if (!In_Delivery)
        pthread_mutex_lock(&Change_Mutex);
}

void after_fork_in_parent()
{
    if (!In_Delivery)
        pthread_mutex_unlock(&Change_Mutex);
}

void after_fork_in_child()
{
    Events_Under_Way.store(In_Delivery ? 1 : 0);
    pthread_mutex_init(&Change_Mutex, nullptr);
}

void establish_fork_handlers()
{
    pthread_atfork(before_fork, after_fork_in_parent, after_fork_in_child);
}

void wait_for_events_under_way()
{
    const timespec a_moment = {0, 20000};
    while (Events_Under_Way.load() != 0)
        nanosleep(&a_moment, nullptr);
}

void stamp(tr_event_t & event)
{
    timespec now = {};
    clock_gettime(CLOCK_MONOTONIC, &now);
    event.nanoseconds = static_cast<kt_uint64_t>(now.tv_sec) * 1000000000 + static_cast<kt_uint64_t>(now.tv_nsec);
    event.thread      = static_cast<kt_uint64_t>(syscall(SYS_gettid));
}

// To the sink, if there is one.
bool deliver_to_sink(const tr_event_t & event)
{
    Events_Under_Way.fetch_add(1);
    const sink_choice * p_choice = Current.load();
    if (p_choice != nullptr)
        p_choice->p_sink(p_choice->p_token, &event);
    Events_Under_Way.fetch_sub(1);
    return p_choice != nullptr;
}

} // namespace

void tr_i_deliver(tr_event_t & event)
{
    if (In_Delivery)
        return;
    const int saved_errno = errno;
    int       old_state   = 0;
    // A thread cancelled in the sink or in the write would stay counted in for good.
    pthread_setcancelstate(PTHREAD_CANCEL_DISABLE, &old_state);
    In_Delivery = true;
    stamp(event);
    if (!deliver_to_sink(event) && tr_i_component_is_traced(event.p_component))
        tr_i_write_line(event);
    In_Delivery = false;
    pthread_setcancelstate(old_state, &old_state);
    errno = saved_errno;
}

extern "C" void tr_set_sink_1(tr_sink_t * p_sink, void * p_token)
{
    if (In_Delivery)
        return;
    pthread_once(&Fork_Handlers_Are_There, establish_fork_handlers);
    int old_state = 0;
    pthread_setcancelstate(PTHREAD_CANCEL_DISABLE, &old_state);
    pthread_mutex_lock(&Change_Mutex);
    Tr_I_Wanted.fetch_and(~static_cast<kt_uint32_t>(TR_I_SINK_IS_SET));
    Current.store(nullptr);
    wait_for_events_under_way();
    Choice = {p_sink, p_token};
    if (p_sink != nullptr) {
        Current.store(&Choice);
        Tr_I_Wanted.fetch_or(TR_I_SINK_IS_SET);
    }
    pthread_mutex_unlock(&Change_Mutex);
    pthread_setcancelstate(old_state, &old_state);
}
