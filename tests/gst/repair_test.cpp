// Files that the tool writes, read and decoded by the framework's own elements.

#include "pipeline.h"

#include <gtest/gtest.h>

#include <sstream>
#include <tuple>

namespace flvd_test {

namespace {

struct Sample {
    const char* name;
    bool video, audio;
};
constexpr Sample g_samples[] = {{"avc_aac", true, true},   {"avc_bframes_aac", true, true}, {"avc_only", true, false},
                                {"h263_mp3", true, true},  {"screen", true, false},         {"aac_only", false, true},
                                {"mp3_only", false, true}, {"speex_only", false, true},     {"pcm_only", false, true}};

using Buffers = std::vector<std::tuple<GstClockTime, GstClockTime, std::string>>; // times, checksum

Buffers Play(const std::string& path, const Sample& sample, const std::string& decoder)
{
    const auto sink = [&](bool has, const char* name) {
        return has ? decoder + "appsink sync=false name=" + name : std::string();
    };
    Pipeline pipeline(demuxed(path, sink(sample.video, "v"), sink(sample.audio, "a"), "flvdemux"));
    EXPECT_EQ(pipeline.play(), "") << path;
    Buffers buffers;
    for (const char* const stream : {"v", "a"})
        for (const Arrival& arrival : pipeline.arrivals(stream))
            buffers.emplace_back(arrival.dts, arrival.pts, arrival.checksum);
    return buffers;
}

} // namespace

TEST(Rewritten, HoldsTheSamePacketsAndPictures)
{
    for (const Sample& sample : g_samples)
        for (const std::string command : {"repair", "index"}) {
            SCOPED_TRACE(command + " " + sample.name);
            const std::string path = std::string(FLVDMX_TEST_DATA "/") + sample.name + ".flv";
            const TemporaryFile copy;
            std::ostringstream line;
            line << FLVDMX_TOOL << ' ' << command << ' ' << path << " -o " << copy.path();
            gint status = -1;
            ASSERT_TRUE(g_spawn_command_line_sync(line.str().c_str(), nullptr, nullptr, &status, nullptr));
            ASSERT_EQ(status, 0);
            for (const char* const decoder : {"", "decodebin ! "}) {
                const Buffers wanted = Play(path, sample, decoder);
                EXPECT_GT(wanted.size(), 3u);
                EXPECT_EQ(Play(copy.path(), sample, decoder), wanted) << decoder;
            }
        }
}

} // namespace flvd_test
