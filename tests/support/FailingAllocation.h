// Lets one allocation of this program fail.
#ifndef VELTRA_TESTS_FAILING_ALLOCATION_H
#define VELTRA_TESTS_FAILING_ALLOCATION_H

// The `count`-th allocation with operator new from now on raises std::bad_alloc; 1 is the next one, 0 lets none fail.
void failAllocation(int count);

// Whether the failure that was asked for has happened.
bool allocationHasFailed();

#endif
