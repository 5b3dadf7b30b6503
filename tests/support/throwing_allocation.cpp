#include "throwing_allocation.h"

#include <cstddef>
#include <cstdlib>
#include <new>

namespace korvtest {
namespace {

// Calls left before the failing one on this thread; 0 when none is armed.
thread_local int tCallsToFailure = 0;
thread_local bool tTriggered = false;

bool FailThisCall()
{
    if (tCallsToFailure == 0 || --tCallsToFailure != 0)
        return false;
    tTriggered = true;
    return true;
}

}  // namespace

ThrowingAllocationFailure::ThrowingAllocationFailure(int nth)
{
    tCallsToFailure = nth;
    tTriggered = false;
}

ThrowingAllocationFailure::~ThrowingAllocationFailure() { tCallsToFailure = 0; }

bool ThrowingAllocationFailure::Triggered() const { return tTriggered; }

}  // namespace korvtest

// Memory from malloc and back to free, both forms of delete included, so
// that the sanitizer's own operators never see a block of ours.
void *operator new(std::size_t size)
{
    if (korvtest::FailThisCall())
        throw std::bad_alloc();
    if (void *block = std::malloc(size == 0 ? 1 : size))
        return block;
    throw std::bad_alloc();
}

void *operator new[](std::size_t size) { return ::operator new(size); }
void operator delete(void *block) noexcept { std::free(block); }
void operator delete[](void *block) noexcept { std::free(block); }
void operator delete(void *block, std::size_t) noexcept { std::free(block); }
void operator delete[](void *block, std::size_t) noexcept { std::free(block); }
void operator delete(void *block, const std::nothrow_t &) noexcept { std::free(block); }
void operator delete[](void *block, const std::nothrow_t &) noexcept { std::free(block); }
