// Allocation-failure sweeps: a job run once for every allocation it makes,
// that allocation failing.
#pragma once

#include <gtest/gtest.h>

#include "support/test_host.h"

namespace zantest {

// The nth allocating call from now fails.
inline void FailAllocation(int n) {
    TestAllocator::Reset();
    TestAllocator::FailNthCall(n);
}

// Runs `attempt(n)` for n = 1, 2, ...: it sets its job up, calls
// FailAllocation(n), runs it and says whether it succeeded. No run leaves a
// block behind, and the first run that meets no failure succeeds.
template <typename Attempt>
void FailEachAllocation(Attempt attempt) {
    for (int n = 1;; ++n) {
        SCOPED_TRACE(::testing::Message() << "allocation " << n << " fails");
        const bool succeeded = attempt(n);
        const int calls = TestAllocator::Calls();
        TestAllocator::Reset();
        EXPECT_EQ(TestAllocator::LiveBlocks(), 0u);
        if (calls < n) {
            EXPECT_TRUE(succeeded);
            return;
        }
    }
}

}  // namespace zantest
