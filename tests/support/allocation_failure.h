// The seam for allocation failures. The test program replaces operator new
// and delete (single objects and arrays, throwing and non-throwing forms)
// with ones that behave as the standard's, except that a test may count
// allocations and make a chosen one fail: the throwing forms then throw
// std::bad_alloc, the non-throwing forms give null.
#ifndef KORVTEST_ALLOCATION_FAILURE_H
#define KORVTEST_ALLOCATION_FAILURE_H

namespace korvtest {

// For its lifetime, the `nth` non-throwing allocation (counted from 1 over
// both forms, anywhere in the process) gives null; all others succeed.
class NothrowAllocationFailure {
public:
    explicit NothrowAllocationFailure(int nth);
    ~NothrowAllocationFailure();
    NothrowAllocationFailure(const NothrowAllocationFailure &) = delete;
    NothrowAllocationFailure &operator=(const NothrowAllocationFailure &) = delete;
};

// For its lifetime, the `nth` allocation of any form (counted from 1,
// anywhere in the process) fails; all others succeed.
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

// Counts the allocations of any form made during its lifetime.
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
