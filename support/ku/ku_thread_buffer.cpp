// SPDX-License-Identifier: MIT
// ku_thread_buffer: a buffer for each thread that has failed at something.
//
// A thread gets it from the system at its first failure and gives it back when it ends: not from malloc, which may be
// what has just failed, and not as thread-local storage, for which a late loaded library would have to allocate too,
// with no way to say that it couldn't.
// Locking: none; a thread sees its own buffer only.
// Failure: NULL. Whoever asks has something else to show then.
#include "ku_thread_buffer.h"

#include <pthread.h>
#include <sys/mman.h>

namespace
{

// In the static block, at a fixed distance from the thread pointer, also in a library that was loaded late: that block
// has little room to spare.
__attribute__((tls_model("initial-exec"))) thread_local constinit ku_thread_buffer_t * P_Buffer = nullptr;

pthread_key_t Buffer_Key;
bool          Buffer_Key_Made = false;

void release_buffer(void * p_buffer)
{
    P_Buffer = nullptr;
    munmap(p_buffer, sizeof(ku_thread_buffer_t));
}

__attribute__((constructor)) void make_buffer_key()
{
    Buffer_Key_Made = pthread_key_create(&Buffer_Key, release_buffer) == 0;
}

// Threads that live on have no destructor left to run; the system takes their buffers with the process.
__attribute__((destructor)) void delete_buffer_key()
{
    if (Buffer_Key_Made)
        pthread_key_delete(Buffer_Key);
    Buffer_Key_Made = false;
}

} // namespace

ku_thread_buffer_t * ku_thread_buffer()
{
    if (P_Buffer != nullptr || !Buffer_Key_Made)
        return P_Buffer;
    void * p_memory =
        mmap(nullptr, sizeof(ku_thread_buffer_t), PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
    if (p_memory == MAP_FAILED)
        return nullptr;
    if (pthread_setspecific(Buffer_Key, p_memory) != 0) {
        munmap(p_memory, sizeof(ku_thread_buffer_t));
        return nullptr;
    }
    P_Buffer = static_cast<ku_thread_buffer_t *>(p_memory);
    return P_Buffer;
}

bool ku_thread_has_buffer()
{
    return P_Buffer != nullptr;
}

size_t ku_end_at_character(char * p_text, size_t room)
{
    size_t end = room - 1;
    while (end > 0 && (static_cast<unsigned char>(p_text[end]) & 0xC0) == 0x80)
        end--;
    p_text[end] = '\0';
    return end;
}
