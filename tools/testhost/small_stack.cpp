#include "small_stack.hpp"

#include <stdexcept>

#if defined(_WIN32)
#include <windows.h>
#else
#include <pthread.h>
#endif

namespace sorvel::testing {
namespace {

#if defined(_WIN32)
DWORD WINAPI trampoline(LPVOID work) {
    (*static_cast<const std::function<void()>*>(work))();
    return 0;
}
#else
void* trampoline(void* work) {
    (*static_cast<const std::function<void()>*>(work))();
    return nullptr;
}
#endif

}  // namespace

void run_on_small_stack(const std::function<void()>& work, std::size_t stack_bytes) {
    void* argument = const_cast<std::function<void()>*>(&work);
#if defined(_WIN32)
    HANDLE thread = CreateThread(nullptr, stack_bytes, trampoline, argument, STACK_SIZE_PARAM_IS_A_RESERVATION, nullptr);
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
    const int failed = pthread_create(&thread, &attributes, trampoline, argument);
    pthread_attr_destroy(&attributes);
    if (failed != 0) {
        throw std::runtime_error("cannot start a thread");
    }
    pthread_join(thread, nullptr);
#endif
}

}  // namespace sorvel::testing
