#include "nothrow_allocation.h"

#include <atomic>
#include <cstddef>
#include <new>

namespace korvtest {
namespace {

// Calls left before the failing one; 0 when no failure is armed.
std::atomic<int> gCallsToFailure{0};

bool FailThisCall()
{
    int left = gCallsToFailure.load();
    while (left > 0 && !gCallsToFailure.compare_exchange_weak(left, left - 1)) {
    }
    return left == 1;
}

}  // namespace

NothrowAllocationFailure::NothrowAllocationFailure(int nth) { gCallsToFailure = nth; }

NothrowAllocationFailure::~NothrowAllocationFailure() { gCallsToFailure = 0; }

}  // namespace korvtest

// As the standard's: the throwing form's allocation, null instead of the
// exception. Memory thus comes from, and goes back through, the ordinary
// operator new and delete.
void *operator new(std::size_t size, const std::nothrow_t &) noexcept
{
    if (korvtest::FailThisCall())
        return nullptr;
    try {
        return ::operator new(size);
    } catch (...) {
        return nullptr;
    }
}

void *operator new[](std::size_t size, const std::nothrow_t &) noexcept
{
    if (korvtest::FailThisCall())
        return nullptr;
    try {
        return ::operator new[](size);
    } catch (...) {
        return nullptr;
    }
}
