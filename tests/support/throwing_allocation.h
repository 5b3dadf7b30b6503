// The seam for std::bad_alloc. The test program replaces the ordinary
// (throwing) operator new and the operator delete that pairs with it, so that
// a test may make one chosen allocation of its own thread throw, and check
// that everything is released while the exception unwinds.
#ifndef KORVTEST_THROWING_ALLOCATION_H
#define KORVTEST_THROWING_ALLOCATION_H

namespace korvtest {

// For its lifetime, the `nth` throwing allocation on this thread (counted
// from 1; operator new and new[]) throws std::bad_alloc; all others succeed.
// Triggered() tells whether the failure has happened.
class ThrowingAllocationFailure {
public:
    explicit ThrowingAllocationFailure(int nth);
    ~ThrowingAllocationFailure();
    ThrowingAllocationFailure(const ThrowingAllocationFailure &) = delete;
    ThrowingAllocationFailure &operator=(const ThrowingAllocationFailure &) = delete;

    bool Triggered() const;
};

}  // namespace korvtest

#endif
