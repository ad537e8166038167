// What a file states about its streams: codec configurations from the first tags, and script data.

#include "support/expected.h"
#include "support/report.h"
#include "support/session.h"

#include <map>
#include <numeric>
#include <set>
#include <sstream>

using namespace flvd_test;

namespace {

constexpr uint32_t OLD = 77; // the value of a field before the call

struct Audio {
    int32_t rc;
    uint32_t rate = OLD, channels = OLD, format_tag = OLD, data_rate = OLD, sample_size = OLD;
    bool operator==(const Audio&) const = default;
};
Audio ParseAudio(int32_t format, const Bytes& data)
{
    flvd_audio_info_t info{OLD, OLD, OLD, OLD, OLD, nullptr, OLD, OLD, OLD};
    const int32_t rc = FLVD_ParseAudioHeader(format, data.data(), static_cast<int32_t>(data.size()), &info);
    EXPECT_EQ(info.reserved, OLD);
    EXPECT_EQ(info.config_size, OLD);
    EXPECT_EQ(info.reserved2, OLD);
    return {rc, info.sample_rate, info.channels, info.format_tag, info.data_rate, info.sample_size};
}

TEST(AudioConfig, OfAac)
{
    const auto expect = [](const std::vector<std::string>& parts, uint32_t rate, uint32_t channels) {
        const std::string bits = std::accumulate(parts.begin(), parts.end(), std::string());
        EXPECT_EQ(ParseAudio(10, Bits(bits)), (Audio{.rc = 0, .rate = rate, .channels = channels})) << bits;
    };
    const uint32_t rates[] = {96000, 88200, 64000, 48000, 44100, 32000, 24000, 22050,
                              16000, 12000, 11025, 8000,  7350,  0,     0,     44100};
    const uint32_t counts[] = {48, 1, 2, 3, 4, 5, 6, 8, 0, 0, 0, 0, 0, 0, 0, 0};
    for (uint32_t i = 0; i < 16; ++i) {
        const std::string index = std::to_string(i) + "/4 ", frequency = i < 15 ? index : "15/4 44100/24 ";
        expect({"2/5 ", frequency, index, "0/3 4294967295/32"}, rates[i], counts[i]);
    }
    // Channel configuration 0: for the general object types, the elements of the program are counted, here 2 + 4 + 1
    // + 1.
    const std::set<uint32_t> general{1, 2, 3, 4, 6, 7, 17, 19, 20, 21, 22, 23};
    const std::string program = "1/1 5/4 3/2 9/4 2/4 4/4 1/4 1/2", core = " 1/1 1/1 5461/14 ", no_core = " 1/1 0/1 ";
    for (uint32_t type = 0; type < 96; ++type) {
        const std::string object = type < 31 ? std::to_string(type) + "/5" : "31/5 " + std::to_string(type - 32) + "/6";
        const uint32_t channels = general.contains(type) ? 8 : 0;
        if (type == 5 || type == 31)
            continue;
        expect({object, " 4/4 0/4", type % 2 != 0 ? core : no_core, program}, 44100, channels);
        expect({"5/5 7/4 0/4 15/4 16777215/24 ", object, core, program}, 22050, channels); // the core's rate
    }
}

TEST(AudioConfig, OfMpegAudio)
{
    const uint32_t bit_rates[][16] = {
        {0, 32, 64, 96, 128, 160, 192, 224, 256, 288, 320, 352, 384, 416, 448, 0},
        {0, 32, 48, 56, 64, 80, 96, 112, 128, 160, 192, 224, 256, 320, 384, 0},
        {0, 32, 40, 48, 56, 64, 80, 96, 112, 128, 160, 192, 224, 256, 320, 0},
        {0, 32, 48, 56, 64, 80, 96, 112, 128, 144, 160, 176, 192, 224, 256, 0}, // low sampling frequencies: layer I
        {0, 8, 16, 24, 32, 40, 48, 56, 64, 80, 96, 112, 128, 144, 160, 0}};     // and the others
    const uint32_t sample_rates[] = {44100, 48000, 32000, 0}, shifts[] = {2, 0, 1, 0};
    for (uint32_t i = 0; i < 1 << 15; ++i) { // all relevant bits after the sync word
        const uint32_t version = i >> 13, layer = i >> 11 & 3, bit_rate = i >> 6 & 15, rate = i >> 4 & 3, mode = i & 3;
        const uint32_t row = version == 3 ? (3 - layer) & 3 : layer == 3 ? 3 : 4;
        const uint32_t channels = mode == 3 ? 1 : 2, tag = layer == 2 ? 0x50 : 0x55;
        const Audio audio{0, sample_rates[rate] >> shifts[version], channels, tag, bit_rates[row][bit_rate], 16};
        EXPECT_EQ(ParseAudio(2, BigEndian(0xFFE00009 | i << 6, 4)),
                  version != 1 && layer != 0 && rate != 3 ? audio : Audio{.rc = -1})
            << i;
    }
}

TEST(VideoConfig, MatchesTheTable)
{
    for (const std::vector<std::string>& row : ReadTable("picture_headers.txt")) {
        ASSERT_EQ(row.size(), 3u) << row[0];
        const int32_t codec = std::stoi(row[0]);
        for (const size_t more : {0u, 8u}) { // one bits after the header change nothing
            Bytes header = Bits(row[1]);
            const auto length = static_cast<int32_t>(header.size());
            header.insert(header.end(), more, 0xFF);
            flvd_video_info_t info{};
            info.width = info.height = OLD;
            const int32_t rc = FLVD_ParseVideoHeader(codec, header.data(), length, &info);
            const std::string size = std::to_string(info.width) + 'x' + std::to_string(info.height);
            EXPECT_EQ(std::to_string(rc) + ' ' + size, row[2]) << row[1] << more;
            EXPECT_EQ(std::string(info.fourcc, 4), rc == 0 && codec == 7 ? "H264" : std::string(4, '\0'));
        }
    }
}

// Opens a file of some tags of a type and describes the stream found: codec, sizes, bytes of its configuration.
std::string Probe(uint8_t type, const std::vector<Bytes>& tags)
{
    Tags all = {type == 9 ? Pcm(0) : Screen(0)};
    for (const Bytes& data : tags)
        all.push_back({type, 0, data});
    FakeHost host(File(all).bytes);
    Session session(host);
    EXPECT_TRUE(session.opened());
    const auto& [video, audio] = std::tie(session.ctx()->video_info, session.ctx()->audio_info);
    std::ostringstream out;
    if (type == 9)
        out << std::string(video.fourcc, 4).c_str() << ' ' << video.width << 'x' << video.height;
    else
        out << audio.format_tag << ' ' << audio.sample_rate << 'x' << audio.channels << ' ' << audio.data_rate;
    out << ' ' << (type == 9 ? video.config_size : audio.config_size);
    return out.str();
}

// The probe gets only the first bytes of an audio tag.
TEST(StreamProbe, NeedsTwelveBytesOfAnAudioTag)
{
    using enum Site;
    const struct {
        const char* name;
        uint8_t header;
        uint32_t filter, rate, channels;
        std::optional<Site> site = {}; // where it fails
        uint32_t bytes = 12;
    } rows[] = {
        {.name = "PCM needs no more", .header = 0x3E, .filter = 0x3E, .rate = 44100, .channels = 1},
        {.name = "no AAC packet type", .header = 0xAF, .filter = 0xAF, .rate = 44100, .channels = 2, .site = AUDIO_TAG},
        {.name = "no MP3 frame header", .header = 0x2A, .filter = 0x2A, .rate = 22050, .channels = 1, .site = MP3_DATA},
        {.name = "short", .header = 0x3E, .filter = 0xFFFF, .rate = 0, .channels = 0, .site = AUDIO_TAG, .bytes = 11},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.name);
        FakeHost host(File({Screen(0), {8, 0, AudioData(row.header, Noise(LARGE))}, Screen(9)}).bytes);
        host.shorten_nth(HostFn::Read, 4, row.bytes); // after file header, tag header and back-pointer
        host.fail_nth(HostFn::Read, 5);
        Session session(host, {0, false, SMALL});
        ASSERT_TRUE(session.opened());
        EXPECT_EQ(session.info().has_audio, row.site ? 0u : 1u);
        EXPECT_EQ(session.ctx()->audio_format_filter, row.filter);
        EXPECT_EQ(session.ctx()->audio_info.sample_rate, row.rate);
        EXPECT_EQ(session.ctx()->audio_info.channels, row.channels);
        EXPECT_TRUE(session.recorded(row.site)) << session.error_line();
    }
}

TEST(StreamProbe, DescribesTheFirstTag)
{
    const auto parameters = [](size_t size) { // in start-code form
        return AvcConfig(AvcRecord({{0x67, 0x42, 0xC0, 0x28, 0xDA, 5, 7, 0xE4}}, {Noise(size - 16)}));
    };
    const Bytes damaged = AvcConfig({1, 66, 0, 40, 0xFF, 0xE1, 0, 9, 0}), large = AvcConfig(Noise(5000));
    const struct {
        const char* what;
        std::vector<Bytes> tags;
        const char* described;
        uint8_t type = 9;
    } rows[] = {
        {.what = "128 bytes of parameter sets", .tags = {parameters(128)}, .described = "H264 320x240 131"},
        {.what = "129 bytes", .tags = {parameters(129)}, .described = " 0x0 132"},
        {.what = "damaged, then too large: the first stays", .tags = {damaged, large}, .described = " 0x0 9"},
        {.what = "too large, then empty", .tags = {damaged, large, {0x17, 0}}, .described = " 0x0 0"},
        {.what = "damaged, then valid", .tags = {damaged, g_avc.data}, .described = "H264 320x240 23"},
        {.what = "AAC", .tags = {AacConfig({0x11, 0x90})}, .described = "43712 48000x2 0 2", .type = 8}, // 0xAAC0
        {.what = "AAC, empty", .tags = {AacConfig({})}, .described = "43712 96000x0 0 0", .type = 8},
        {.what = "AAC, missing", .tags = {AacRaw(Noise(20), 0xAA)}, .described = "43712 22050x1 0 0", .type = 8},
        {.what = "MP3", .tags = {AudioData(SOUND_MP3, Mp3Frame())}, .described = "85 44100x2 128 0", .type = 8},
        {.what = "8 kHz, II", .tags = {{0xEE, 0xFF, 0xFD, 0x90, 0xC4}}, .described = "85 44100x1 160 0", .type = 8},
        {.what = "PCM, 5.5 kHz", .tags = {AudioData(0x32, Noise(20))}, .described = "0 5500x1 0 0", .type = 8},
        {.what = "PCM, 11 kHz", .tags = {AudioData(0x35, Noise(20))}, .described = "0 11025x2 0 0", .type = 8},
    };
    for (const auto& row : rows)
        EXPECT_EQ(Probe(row.type, row.tags), row.described) << row.what;
    // Data that starts with a picture header for each codec that has one.
    const Bytes any = Concat({{0, 0, 0x46, 15, 0, 0x46, 20, 0, 15, 20}, H263Picture(3)});
    const char* const codecs[] = {" 0x0 0",         "JPEG 0x0 0", "FLV1 176x144 0", "SCR1 0x0 0", "VP60 320x1120 0",
                                  "VP6A 320x240 0", "SCR2 0x0 0", " 0x0 206",       " 0x0 0"};
    for (size_t codec = 0; codec < std::size(codecs); ++codec)
        EXPECT_EQ(Probe(9, {VideoData(1, static_cast<uint8_t>(codec), any)}), codecs[codec]);
}

// Reads script data after the tags of a file: `length` bytes, 0 for all. Returns the result, and all values in the
// instance that are not 0.
void Expect(const std::string& text, const std::string& told, uint32_t options = 0, uint32_t length = 0,
            HostFn failing = HostFn::Eof, uint64_t nth = 0)
{
    constexpr int64_t START = 89;
    const Bytes payload = Amf(text);
    FakeHost host(Concat({File({Pcm(0)}, 4).bytes, payload, Bytes(20, 0xEE)}));
    Session session(host, {options | USER});
    flvd_ctx_t& ctx = *session.ctx();
    ctx.audio_info = {};
    ctx.file_size = 0;
    __FLV_DMX__fioSeek64(ctx.cur_reader, START, FIO_SEEK_SET);
    host.reset_calls();
    host.fail_nth(failing, nth);
    std::ostringstream out;
    out << FLVD_ReadMetadata(&ctx, length != 0 ? length : static_cast<uint32_t>(payload.size()));
    host.fail_nothing();
    const auto read = static_cast<uint64_t>(__FLV_DMX__fioTell64(ctx.cur_reader) - START);
    const bool stays = failing == HostFn::Tell && nth == 1; // without the position, the end of the payload is unknown
    const uint64_t due = stays ? 0 : length != 0 ? length : payload.size();
    EXPECT_TRUE(failing == HostFn::Seek || read == due) << text << read; // whatever the result
    const auto& [video, audio, index, arrays] =
        std::tie(ctx.video_info, ctx.audio_info, ctx.keyframe_index, ctx.keyframe_arrays);
    const std::pair<const char*, int64_t> all[] = {
        {"width", video.width},           {"height", video.height},
        {"rate", video.frame_rate},       {"delay", ctx.audio_delay_ms},
        {"kbits", audio.data_rate},       {"hertz", audio.sample_rate},
        {"bits", audio.sample_size},      {"key at", ctx.last_keyframe_pos},
        {"key ms", ctx.last_keyframe_ms}, {"and", video.last_key_time_ms},
        {"size", ctx.file_size},          {"shorter", ctx.file_shorter_than_meta},
        {"entries", index.entry_count},   {"T", index.times_offset},
        {"P", index.positions_offset},    {"allocated", host.calls(HostFn::Alloc)}};
    for (const auto& [name, value] : all)
        if (value != 0)
            out << ' ' << name << ' ' << value;
    for (uint32_t i = 0; i < arrays.times_count; ++i)
        out << (i == 0 ? " times " : ",") << arrays.times_ms[i];
    for (uint32_t i = 0; i < arrays.positions_count; ++i)
        out << (i == 0 ? " positions " : ",") << arrays.positions[i];
    EXPECT_EQ(out.str(), told) << text;
}

// Opens a file with these properties in its first tag.
std::string Index(const std::string& properties, uint32_t options)
{
    FakeHost host(File({{18, 0, OnMetaData(properties)}, Pcm(5)}, 4).bytes);
    const Session session(host, {options});
    const char* const by[] = {"none", "index", "scan"};
    return "by " + std::string(by[session.ctx()->seek_method]) + ' ' + std::to_string(session.ctx()->last_keyframe_ms);
}

TEST(ScriptData, MatchesTheTable)
{
    // Options of the first column, with the length of the payload, 0 for all.
    const std::map<std::string, std::pair<uint32_t, uint32_t>> opens = {
        {"-", {0, 0}}, {"index", {INDEX, 0}}, {"growing", {GROWING, 0}}, {"index, endless", {INDEX, 0xFFFFFFF0}}};
    for (const std::vector<std::string>& row : ReadTable("script_data.txt")) {
        ASSERT_EQ(row.size(), 3u) << row[0];
        if (row[0].find("file") == 0) {
            EXPECT_EQ(Index(row[1], row[0] == "file" ? 0 : INDEX), row[2]) << row[1];
            continue;
        }
        const auto& [options, length] = opens.at(row[0]);
        Expect(row[1], row[2], options, length);
    }
}

TEST(ScriptValue, EndsWhenTheHostFails)
{
    Expect("%5.5.5", "-101", 0, 3, HostFn::Seek, 1);
    Expect("'text", "0", 0, 3, HostFn::Seek, 1); // a failed seek back from after the payload does not matter
    Expect("'text", "-1", 0, 3, HostFn::Tell, 1);
    Expect("{ keyframes: { times: [2 1 2 filepositions: [2 5 6 } }", "0 entries 2 P 152", 0, 0, HostFn::Tell, 2);
}

TEST(ScriptValue, IsBounded)
{
    std::string deep, keys, high = "< width: 320 > ";
    for (int i = 0; i < 63; ++i) {
        deep += "[1 ";
        keys += "{ a: %1.1.0 %0.1.2.3.4.5.6.7 ";
    }
    Expect(deep + high + deep + "< height: 240 >", "0 width 320 height 240");
    Expect("[1 " + deep + high, "-1");
    Expect("< width: 320 >", "-1", 0, 12); // a value that starts after the end is not read
    Expect("< width: 320 >", "0 width 320", 0, 13);
    Expect("{ a: %5 } 1", "0", 0, 16);              // more bytes were read than counted
    Expect(keys + "< width: 320 >", "0 width 320"); // an empty key is not counted
}

TEST(KeyframeIndex, CannotBeReadPastTheEndOfTheFile)
{
    const std::string at_end = "keyframes: { times: [9 1 1 1 1 1 1 1 1 1 filepositions: [9 13 2 2 }";
    FakeHost host(File({Pcm(5), {18, 0, OnMetaData(at_end)}}, 4).bytes);
    EXPECT_EQ(Session(host).open_rc(), -1);
    EXPECT_EQ(g_flvd_lLastError, FLVD_ERR_EXTENT);
}

} // namespace
