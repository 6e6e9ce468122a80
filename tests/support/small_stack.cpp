#include "small_stack.hpp"

#include <stdexcept>

#if defined(_WIN32)
#include <windows.h>
#else
#include <pthread.h>
#endif

namespace sorvel::test {
namespace {

struct Work {
    const std::function<void()>* run;
    bool finished = false;
};

void run_work(void* argument) {
    auto* work = static_cast<Work*>(argument);
    (*work->run)();
    work->finished = true;
}

#if defined(_WIN32)
DWORD WINAPI trampoline(LPVOID argument) {
    run_work(argument);
    return 0;
}
#else
void* trampoline(void* argument) {
    run_work(argument);
    return nullptr;
}
#endif

}  // namespace

bool run_on_small_stack(const std::function<void()>& work, std::size_t stack_bytes) {
    Work state{&work};
#if defined(_WIN32)
    // Without the reservation flag the size would only be the first commit.
    HANDLE thread = CreateThread(nullptr, stack_bytes, trampoline, &state, STACK_SIZE_PARAM_IS_A_RESERVATION, nullptr);
    if (thread == nullptr) {
        throw std::runtime_error("cannot start a thread");
    }
    WaitForSingleObject(thread, INFINITE);
    CloseHandle(thread);
#else
    pthread_attr_t attributes;
    pthread_attr_init(&attributes);
    pthread_attr_setstacksize(&attributes, stack_bytes);
    pthread_t thread;
    const int failed = pthread_create(&thread, &attributes, trampoline, &state);
    pthread_attr_destroy(&attributes);
    if (failed != 0) {
        throw std::runtime_error("cannot start a thread");
    }
    pthread_join(thread, nullptr);
#endif
    return state.finished;
}

}  // namespace sorvel::test
