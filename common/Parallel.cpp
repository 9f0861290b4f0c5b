#include "Parallel.h"

#include <exception>
#include <thread>

void onTwoThreads(const std::function<void()> &here, const std::function<void()> &beside)
{
    std::exception_ptr besideError;
    std::thread thread([&] {
        try {
            beside();
        } catch (...) {
            besideError = std::current_exception();
        }
    });
    try {
        here();
    } catch (...) {
        thread.join();
        throw;
    }
    thread.join();
    if (besideError)
        std::rethrow_exception(besideError);
}
