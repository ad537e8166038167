// Ends the framework in the end, which lets its tracer report what is still alive.

#include <gst/gst.h>
#include <gtest/gtest.h>

int main(int argc, char** argv)
{
    gst_init(&argc, &argv);
    testing::InitGoogleTest(&argc, argv);
    const int result = RUN_ALL_TESTS();
    gst_deinit();
    return result;
}
