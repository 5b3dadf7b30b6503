#include "allocation_failure.h"

#include <atomic>
#include <cstddef>
#include <cstdlib>
#include <new>

namespace korvtest {
namespace {

// Non-throwing calls left before the failing one; 0 when none is armed.
std::atomic<int> gNothrowToFailure{0};
// Allocations of any form left before the failing one; 0 when none is armed.
std::atomic<long> gAnyToFailure{0};
std::atomic<bool> gFailed{false};
std::atomic<bool> gFailedNothrow{false};
std::atomic<bool> gCounting{false};
std::atomic<long> gCount{0};

bool CountDown(std::atomic<long> &left)
{
    long now = left.load();
    while (now > 0 && !left.compare_exchange_weak(now, now - 1)) {
    }
    return now == 1;
}

bool CountDown(std::atomic<int> &left)
{
    int now = left.load();
    while (now > 0 && !left.compare_exchange_weak(now, now - 1)) {
    }
    return now == 1;
}

// Whether this allocation is the one to fail.
bool FailThisAllocation(bool nothrow)
{
    if (gCounting)
        ++gCount;
    bool fail = CountDown(gAnyToFailure);
    if (nothrow && CountDown(gNothrowToFailure))
        fail = true;
    if (fail) {
        gFailed = true;
        gFailedNothrow = nothrow;
    }
    return fail;
}

void *Allocate(std::size_t size)
{
    if (FailThisAllocation(false))
        throw std::bad_alloc();
    void *block = std::malloc(size ? size : 1);
    if (block == nullptr)
        throw std::bad_alloc();
    return block;
}

void *AllocateOrNull(std::size_t size) noexcept
{
    if (FailThisAllocation(true))
        return nullptr;
    return std::malloc(size ? size : 1);
}

}  // namespace

NothrowAllocationFailure::NothrowAllocationFailure(int nth) { gNothrowToFailure = nth; }
NothrowAllocationFailure::~NothrowAllocationFailure() { gNothrowToFailure = 0; }

AllocationFailure::AllocationFailure(long nth)
{
    gFailed = false;
    gFailedNothrow = false;
    gAnyToFailure = nth;
}
AllocationFailure::~AllocationFailure() { Stop(); }
void AllocationFailure::Stop() { gAnyToFailure = 0; }
bool AllocationFailure::Failed() const { return gFailed; }
bool AllocationFailure::FailedNothrow() const { return gFailed && gFailedNothrow; }

AllocationCount::AllocationCount()
{
    gCount = 0;
    gCounting = true;
}
AllocationCount::~AllocationCount() { Stop(); }
void AllocationCount::Stop() { gCounting = false; }
long AllocationCount::Count() const { return gCount; }

}  // namespace korvtest

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
