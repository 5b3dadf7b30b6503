#include "allocation_failure.h"

#include <cstddef>
#include <cstdlib>
#include <new>

namespace korvtest {
namespace {

// Allocations left before the failing one, per seam; 0 when none is armed.
thread_local long tNothrowLeft = 0;
thread_local long tThrowingLeft = 0;
thread_local long tAnyLeft = 0;
thread_local bool tFailed = false;
thread_local bool tFailedNothrow = false;
thread_local bool tCounting = false;
thread_local long tCount = 0;

// Counts down an armed seam; true on its chosen allocation.
bool Due(long &left) { return left > 0 && --left == 0; }

bool FailThisAllocation(bool nothrow)
{
    if (tCounting)
        ++tCount;
    bool fail = Due(tAnyLeft);
    fail = Due(nothrow ? tNothrowLeft : tThrowingLeft) || fail;
    if (fail) {
        tFailed = true;
        tFailedNothrow = nothrow;
    }
    return fail;
}

void *Allocate(std::size_t size)
{
    if (FailThisAllocation(false))
        throw std::bad_alloc();
    if (void *block = std::malloc(size == 0 ? 1 : size))
        return block;
    throw std::bad_alloc();
}

void *AllocateOrNull(std::size_t size) noexcept
{
    if (FailThisAllocation(true))
        return nullptr;
    return std::malloc(size == 0 ? 1 : size);
}

}  // namespace

NothrowAllocationFailure::NothrowAllocationFailure(int nth) { tNothrowLeft = nth; }
NothrowAllocationFailure::~NothrowAllocationFailure() { tNothrowLeft = 0; }

ThrowingAllocationFailure::ThrowingAllocationFailure(int nth)
{
    tThrowingLeft = nth;
    tFailed = false;
}
ThrowingAllocationFailure::~ThrowingAllocationFailure() { tThrowingLeft = 0; }
bool ThrowingAllocationFailure::Triggered() const { return tFailed; }

AllocationFailure::AllocationFailure(long nth)
{
    tFailed = false;
    tFailedNothrow = false;
    tAnyLeft = nth;
}
AllocationFailure::~AllocationFailure() { Stop(); }
void AllocationFailure::Stop() { tAnyLeft = 0; }
bool AllocationFailure::Failed() const { return tFailed; }
bool AllocationFailure::FailedNothrow() const { return tFailed && tFailedNothrow; }

AllocationCount::AllocationCount()
{
    tCount = 0;
    tCounting = true;
}
AllocationCount::~AllocationCount() { Stop(); }
void AllocationCount::Stop() { tCounting = false; }
long AllocationCount::Count() const { return tCount; }

}  // namespace korvtest

// Memory from malloc and back to free, every form of delete included, so
// that the sanitizer's own operators never see a block of ours.
void *operator new(std::size_t size) { return korvtest::Allocate(size); }
void *operator new[](std::size_t size) { return korvtest::Allocate(size); }
void *operator new(std::size_t size, const std::nothrow_t &) noexcept
{
    return korvtest::AllocateOrNull(size);
}
void *operator new[](std::size_t size, const std::nothrow_t &) noexcept
{
    return korvtest::AllocateOrNull(size);
}
void operator delete(void *block) noexcept { std::free(block); }
void operator delete[](void *block) noexcept { std::free(block); }
void operator delete(void *block, std::size_t) noexcept { std::free(block); }
void operator delete[](void *block, std::size_t) noexcept { std::free(block); }
void operator delete(void *block, const std::nothrow_t &) noexcept { std::free(block); }
void operator delete[](void *block, const std::nothrow_t &) noexcept { std::free(block); }
