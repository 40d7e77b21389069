// Lets one allocation of this program fail: with operator new where a test links FailingNew.cpp, in OpenSSL, and
// wherever else a test has its allocations ask.
#ifndef VELTRA_TESTS_FAILING_ALLOCATION_H
#define VELTRA_TESTS_FAILING_ALLOCATION_H

// The `count`-th allocation from now on fails; 1 is the next one, 0 lets none fail.
void failAllocation(int count);

// Whether the failure that was asked for last has happened.
bool allocationHasFailed();

// Whether the allocation that asks may succeed.
bool mayAllocate();

// Has OpenSSL ask too, which has allocated nothing yet.
void failAllocationsOfOpenSSL();

#endif
