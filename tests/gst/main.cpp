// Runs the tests with the plugin of this build and with the framework's leak tracer, which prints leaks at the end.
// A misuse of the framework aborts them.

#include <gst/gst.h>
#include <gtest/gtest.h>

int main(int argc, char** argv)
{
    testing::InitGoogleTest(&argc, argv);
    if (GTEST_FLAG_GET(list_tests))
        return RUN_ALL_TESTS();
    g_setenv("GST_PLUGIN_PATH", FLVDMX_PLUGIN_PATH, TRUE);
    g_setenv("GST_REGISTRY", FLVDMX_GST_REGISTRY, TRUE);
    g_setenv("GST_TRACERS", "leaks", TRUE);
    g_setenv("GST_DEBUG", "GST_TRACER:7", FALSE);
    gst_init(nullptr, nullptr);
    g_log_set_always_fatal(static_cast<GLogLevelFlags>(G_LOG_LEVEL_CRITICAL | G_LOG_FATAL_MASK));
    const int result = RUN_ALL_TESTS();
    gst_deinit();
    return result;
}
