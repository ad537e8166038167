/* Makes breaches of the fake host's contract fail the running test. For GoogleTest sources only. */
#pragma once

#include "fake_host.h"

#include <gtest/gtest.h>

namespace flvd_test {

inline const bool g_reportsToGoogleTest = [] {
    FakeHost::set_violation_handler([](const std::string& what) { ADD_FAILURE() << "fake host: " << what; });
    return true;
}();

} // namespace flvd_test
