// The client library under allocation failure: every allocation of building, flattening and
// starting a request fails once in turn; each call then answers GLYPHWELL_ERROR_NO_MEMORY (or
// succeeds), no C++ exception crosses the C interface, and nothing leaks (the suite runs under
// LeakSanitizer).
#include <gtest/gtest.h>

#include "glyphwell/client.h"
#include "support/FailingAllocator.h"

namespace {

using glyphwell::testing::gAllocationsBeforeFailure;

/// Builds, flattens and starts one download request against a port nobody serves; the status of
/// the first call that does not succeed, or GLYPHWELL_OK.
int AskOnce() {
    glyphwell_request* request = glyphwell_request_new(GLYPHWELL_ASK_DOWNLOAD);
    if (!request)
        return GLYPHWELL_ERROR_NO_MEMORY;
    int status = glyphwell_request_set_application_name(request, "Fault Editor");
    for (int i = 0; status == GLYPHWELL_OK && i < 12; ++i)
        status = glyphwell_request_add_font(request, "Fault-Font-With-A-Long-Name", "Fault");
    if (status == GLYPHWELL_OK)
        status = glyphwell_request_set_bundle_path(request, "/usr/share/applications/x.desktop");
    const void* bytes = nullptr;
    size_t length = 0;
    if (status == GLYPHWELL_OK)
        status = glyphwell_request_get_bytes(request, &bytes, &length);
    glyphwell_call* call = nullptr;
    if (status == GLYPHWELL_OK)
        status = glyphwell_call_start(request, "org.glyphwell.Test.NobodyServes", &call);
    glyphwell_call_free(call);
    glyphwell_request_free(request);
    return status;
}

TEST(ClientFaults, EveryFailedAllocationIsReportedAsNoMemoryWithoutLeaks) {
    // Without a failure the request gets as far as finding nobody there.
    ASSERT_EQ(AskOnce(), GLYPHWELL_ERROR_NOT_RUNNING);
    int failures = 0;
    for (long n = 0;; ++n) {
        gAllocationsBeforeFailure = n;
        const int status = AskOnce();
        const bool failed = gAllocationsBeforeFailure == -1;
        gAllocationsBeforeFailure = -1;
        if (!failed) {
            EXPECT_EQ(status, GLYPHWELL_ERROR_NOT_RUNNING);
            break;
        }
        SCOPED_TRACE(n);
        EXPECT_TRUE(status == GLYPHWELL_ERROR_NO_MEMORY || status == GLYPHWELL_ERROR_NOT_RUNNING)
            << "status " << status;
        failures += status == GLYPHWELL_ERROR_NO_MEMORY;
    }
    EXPECT_GT(failures, 10);
}

} // namespace
