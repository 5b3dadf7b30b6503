// The seam for allocation failures that the library handles itself. The
// test program replaces the non-throwing forms of operator new (single
// objects and arrays) with ones that behave as the standard's, except that a
// test may make one chosen call give null.
#ifndef KORVTEST_NOTHROW_ALLOCATION_H
#define KORVTEST_NOTHROW_ALLOCATION_H

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

}  // namespace korvtest

#endif
