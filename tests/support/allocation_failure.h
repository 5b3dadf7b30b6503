// The seam for allocation failures. The test program replaces operator new
// and delete (single objects and arrays, throwing and non-throwing forms)
// with ones that behave as the standard's, except that a test may count the
// allocations of its own thread and make a chosen one fail: a throwing form
// then throws std::bad_alloc, a non-throwing form gives null.
#ifndef KORVTEST_ALLOCATION_FAILURE_H
#define KORVTEST_ALLOCATION_FAILURE_H

namespace korvtest {

// For its lifetime, the `nth` non-throwing allocation on this thread
// (counted from 1 over both forms) gives null; all others succeed.
class NothrowAllocationFailure {
public:
    explicit NothrowAllocationFailure(int nth);
    ~NothrowAllocationFailure();
    NothrowAllocationFailure(const NothrowAllocationFailure &) = delete;
    NothrowAllocationFailure &operator=(const NothrowAllocationFailure &) = delete;
};

// For its lifetime, the `nth` throwing allocation on this thread (counted
// from 1; operator new and new[]) throws std::bad_alloc; all others succeed.
class ThrowingAllocationFailure {
public:
    explicit ThrowingAllocationFailure(int nth);
    ~ThrowingAllocationFailure();
    ThrowingAllocationFailure(const ThrowingAllocationFailure &) = delete;
    ThrowingAllocationFailure &operator=(const ThrowingAllocationFailure &) = delete;

    // Whether the failure has happened.
    bool Triggered() const;
};

// For its lifetime (or until Stop), the `nth` allocation of any form on
// this thread fails; all others succeed.
class AllocationFailure {
public:
    explicit AllocationFailure(long nth);
    ~AllocationFailure();
    AllocationFailure(const AllocationFailure &) = delete;
    AllocationFailure &operator=(const AllocationFailure &) = delete;

    // Disarms before the end of its lifetime.
    void Stop();

    // Whether the chosen allocation came, and whether it was a non-throwing one.
    bool Failed() const;
    bool FailedNothrow() const;
};

// Counts the allocations of any form on this thread during its lifetime
// (or until Stop).
class AllocationCount {
public:
    AllocationCount();
    ~AllocationCount();
    AllocationCount(const AllocationCount &) = delete;
    AllocationCount &operator=(const AllocationCount &) = delete;

    // Stops counting before the end of its lifetime.
    void Stop();

    long Count() const;
};

}  // namespace korvtest

#endif
