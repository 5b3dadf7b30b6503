#include "allocation_failure.h"

#include <cstddef>
#include <cstdlib>
#include <new>

namespace korvtest {
namespace {

// Allocations left before the failing one, per seam; 0 when none is armed.
thread_local long tNothrowLeft = 0, tThrowingLeft = 0, tAnyLeft = 0, tCount = 0;
thread_local bool tFailed = false, tFailedNothrow = false, tCounting = false;

// Counts down an armed seam; true on its chosen allocation.
bool Due(long &left) { return left > 0 && --left == 0; }

bool FailThisAllocation(bool nothrow)
{
    tCount += tCounting ? 1 : 0;
    const bool anyDue = Due(tAnyLeft);
    if (!Due(nothrow ? tNothrowLeft : tThrowingLeft) && !anyDue)
        return false;
    tFailedNothrow = nothrow;
    return tFailed = true;
}

void *Allocate(std::size_t size)
{
    void *block = FailThisAllocation(false) ? nullptr : std::malloc(size == 0 ? 1 : size);
    if (block == nullptr) throw std::bad_alloc();
    return block;
}

void *AllocateOrNull(std::size_t size) noexcept
{
    return FailThisAllocation(true) ? nullptr : std::malloc(size == 0 ? 1 : size);
}

}  // namespace

NothrowAllocationFailure::NothrowAllocationFailure(int nth) { tNothrowLeft = nth; }
NothrowAllocationFailure::~NothrowAllocationFailure() { tNothrowLeft = 0; }

ThrowingAllocationFailure::ThrowingAllocationFailure(int nth) { tThrowingLeft = nth; tFailed = false; }
ThrowingAllocationFailure::~ThrowingAllocationFailure() { tThrowingLeft = 0; }
bool ThrowingAllocationFailure::Triggered() const { return tFailed; }

AllocationFailure::AllocationFailure(long nth) { tFailed = tFailedNothrow = false; tAnyLeft = nth; }
AllocationFailure::~AllocationFailure() { Stop(); }
void AllocationFailure::Stop() { tAnyLeft = 0; }
bool AllocationFailure::Failed() const { return tFailed; }
bool AllocationFailure::FailedNothrow() const { return tFailed && tFailedNothrow; }

AllocationCount::AllocationCount() { tCount = 0; tCounting = true; }
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
