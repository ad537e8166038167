// What a file tells of its streams: codec configuration from the first tags, and script data.

#include "support/report.h"
#include "support/session.h"

#include <cmath>
#include <cstring>
#include <set>
#include <sstream>

using namespace flvd_test;
using namespace std::string_literals;

namespace {

constexpr uint32_t OLD = 77; // what stands in a field before

// Bits from words: n/b is n in b bits, n is ue(n), +n and -n are se(n).
Bytes Bits(const std::vector<std::string>& texts)
{
    BitWriter out;
    for (const std::string& text : texts) {
        std::istringstream in(text);
        for (std::string word; std::getline(in >> std::ws, word, ' ');) {
            const size_t slash = word.find('/');
            if (slash != std::string::npos)
                out.u(std::stoi(word.substr(slash + 1)), static_cast<uint32_t>(std::stoul(word)));
            else if (word[0] == '+' || word[0] == '-')
                out.se(std::stoi(word));
            else
                out.ue(static_cast<uint32_t>(std::stoul(word)));
        }
    }
    return out.bytes();
}

// Result, sample rate, channels, format tag, data rate, sample size.
using Audio = std::tuple<int32_t, uint32_t, uint32_t, uint32_t, uint32_t, uint32_t>;
constexpr Audio NO_AUDIO{-1, OLD, OLD, OLD, OLD, OLD};
Audio ParseAudio(int32_t format, const Bytes& data)
{
    flvd_audio_info_t info{OLD, OLD, OLD, OLD, OLD, nullptr, OLD, OLD, OLD};
    const int32_t rc = FLVD_ParseAudioHeader(format, data.data(), static_cast<int32_t>(data.size()), &info);
    EXPECT_EQ(info.reserved + info.config_size + info.reserved2, 3 * OLD);
    return {rc, info.sample_rate, info.channels, info.format_tag, info.data_rate, info.sample_size};
}
void ExpectAac(const Bytes& data, uint32_t rate, uint32_t channels)
{
    EXPECT_EQ(ParseAudio(10, data), Audio(0, rate, channels, OLD, OLD, OLD)) << testing::PrintToString(data);
}

TEST(AudioConfig, OfAac)
{
    ExpectAac({0x12, 0x10}, 44100, 2);
    ExpectAac({0x11, 0x90}, 48000, 2);
    ExpectAac({0x2B, 0x92, 0x08, 0x00}, 22050, 2); // the core's rate, not the extension's
    ExpectAac({}, 96000, 0);
    ExpectAac({0x12}, 44100, 0);
    const uint32_t rates[] = {96000, 88200, 64000, 48000, 44100, 32000, 24000, 22050,
                              16000, 12000, 11025, 8000,  7350,  0,     0,     44100};
    const uint32_t counts[] = {48, 1, 2, 3, 4, 5, 6, 8, 0, 0, 0, 0, 0, 0, 0, 0};
    for (uint32_t i = 0; i < 16; ++i) {
        const std::string index = std::to_string(i) + "/4", frequency = i < 15 ? index : "15/4 44100/24";
        ExpectAac(Bits({"2/5", frequency, index, "0/3 4294967295/32"}), rates[i], counts[i]);
    }
    // Channel configuration 0: a general type counts the elements of its program, here 2 + 4 + 1 + 1.
    const std::set<uint32_t> general{1, 2, 3, 4, 6, 7, 17, 19, 20, 21, 22, 23};
    const std::string program = "1/1 5/4 3/2 9/4 2/4 4/4 1/4 1/2", core = "1/1 1/1 5461/14", no_core = "1/1 0/1";
    for (uint32_t type = 0; type < 96; ++type) {
        const std::string object = type < 31 ? std::to_string(type) + "/5" : "31/5 " + std::to_string(type - 32) + "/6";
        const uint32_t channels = general.count(type) != 0 ? 8 : 0;
        if (type == 5 || type == 31)
            continue;
        ExpectAac(Bits({object, "4/4 0/4", type % 2 != 0 ? core : no_core, program}), 44100, channels);
        ExpectAac(Bits({"5/5 7/4 0/4 15/4 16777215/24", object, core, program}), 22050, channels);
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
    const uint32_t sample_rates[] = {44100, 48000, 32000}, shifts[] = {2, 0, 1, 0};
    const auto header = [](uint32_t version, uint32_t layer, uint32_t bit_rate, uint32_t rate, uint32_t mode) {
        return BitWriter()
            .u(32, 0xFFE10009 | version << 19 | layer << 17 | bit_rate << 12 | rate << 10 | mode << 6)
            .bytes();
    };
    for (uint32_t i = 0; i < 4 * 4 * 16 * 4; ++i) {
        const uint32_t version = i & 3, layer = i >> 2 & 3, bit_rate = i >> 4 & 15, rate = i >> 8, mode = i % 5 % 4;
        const uint32_t row = version == 3 ? (3 - layer) & 3 : layer == 3 ? 3 : 4;
        const uint32_t sample_rate = rate < 3 ? sample_rates[rate] >> shifts[version] : 0;
        const bool valid = version != 1 && layer != 0 && rate != 3;
        const Audio audio{0, sample_rate, mode == 3 ? 1 : 2, layer == 2 ? 0x50 : 0x55, bit_rates[row][bit_rate], 16};
        EXPECT_EQ(ParseAudio(2, header(version, layer, bit_rate, rate, mode)), valid ? audio : NO_AUDIO) << i;
    }
    const Bytes good = header(3, 1, 9, 0, 1), no_sync{0xFF, 0x1B, 0xA0, 0x64};
    for (const Bytes& before : {header(3, 1, 9, 3, 1), header(1, 1, 9, 0, 1), header(3, 0, 9, 0, 1), no_sync})
        EXPECT_EQ(ParseAudio(14, Concat({before, good})), Audio(0, 44100, 2, 0x55, 128, 16));
    EXPECT_EQ(ParseAudio(2, Bytes(good.begin(), good.end() - 1)), NO_AUDIO);
    for (const int32_t format : {0, 1, 3, 6, 11, 15, -1})
        EXPECT_EQ(ParseAudio(format, good), NO_AUDIO);
}

using Video = std::tuple<int32_t, uint32_t, uint32_t>; // result, width, height
constexpr Video NO_VIDEO{-1, OLD, OLD};
Video ParseVideo(int32_t codec, const Bytes& data)
{
    flvd_video_info_t info{};
    info.width = info.height = OLD;
    const int32_t rc = FLVD_ParseVideoHeader(codec, data.data(), static_cast<int32_t>(data.size()), &info);
    EXPECT_EQ(std::string(info.fourcc, sizeof info.fourcc), rc == 0 && codec == 7 ? "H264" : std::string(4, '\0'));
    return {rc, info.width, info.height};
}

TEST(VideoConfig, OfPictureHeaders)
{
    const Video sizes[] = {{0, 40, 30},  {0, 4000, 3000}, {0, 352, 288}, {0, 176, 144},
                           {0, 128, 96}, {0, 320, 240},   {0, 160, 120}, {0, OLD, OLD}};
    for (uint32_t code = 0; code < 8; ++code) {
        const Bytes picture = H263Picture(code, code == 0 ? 40 : 4000, code == 0 ? 30 : 3000, 20);
        EXPECT_EQ(ParseVideo(2, picture), sizes[code]);
        EXPECT_EQ(ParseVideo(2, Concat({{0x11, 0, 0, 0x7F, 0}, picture})), sizes[code]);
    }
    EXPECT_EQ(ParseVideo(2, {0, 0, 0x80, 1, 0, 0, 0, 0}), Video(0, 352, 288));
    EXPECT_EQ(ParseVideo(2, {1, 2, 3, 0, 0, 0x80, 0, 0}), Video(0, 0, 0)); // the last place for a start code
    EXPECT_EQ(ParseVideo(2, {1, 2, 3, 4, 0, 0, 0x80, 0}), NO_VIDEO);
    EXPECT_EQ(ParseVideo(4, {0, 0, 0x46, 15, 20, 14, 19, 0}), Video(0, 304, 224));
    EXPECT_EQ(ParseVideo(4, {0x35, 0x7E, 0x46, 15, 20, 14, 19, 0}), Video(0, 301, 219));
    EXPECT_EQ(ParseVideo(4, {0x10, 0, 0x46, 15, 20, 14, 0, 0}), Video(0, UINT32_MAX, 224));
    EXPECT_EQ(ParseVideo(4, {0, 0, 0x40, 1, 2, 15, 20, 14, 19}), Video(0, 304, 224)); // profile 0
    EXPECT_EQ(ParseVideo(4, {0, 1, 0x46, 1, 2, 15, 20, 14, 19}), Video(0, 304, 224)); // separated coefficients
    EXPECT_EQ(ParseVideo(4, {0, 0, 0x40, 1, 2, 15, 20, 14}), Video(0, 0, 224));
    EXPECT_EQ(ParseVideo(5, {0, 0x80, 0xFF, 0xFF, 0, 0x46, 15, 20, 14, 19}), Video(0, 304, 224));
    for (int32_t codec = -1; codec < 17; ++codec) {
        EXPECT_EQ(ParseVideo(codec, {0, 0, 0x80, 1, 0x67, 66, 0}), NO_VIDEO); // seven bytes
        const bool known = codec == 2 || codec == 4 || codec == 5 || codec == 7;
        EXPECT_EQ(ParseVideo(codec, {0, 0x80, 0, 0, 0x80, 15, 20, 14, 19}) == NO_VIDEO, codec != 2); // inter frames
        EXPECT_TRUE(known || ParseVideo(codec, Bytes(20)) == NO_VIDEO);
    }
}

TEST(AvcConfigRecord, BecomesStartCodeForm)
{
    const auto convert = [](const Bytes& record, size_t capacity) {
        Bytes out(capacity + 1, 0xEE);
        const auto length = static_cast<int32_t>(record.size()), room = static_cast<int32_t>(capacity);
        const int32_t size = FLVD_GetAVCSeqHeaderFromAvcC(record.data(), length, out.data(), room);
        EXPECT_EQ(out.back(), 0xEE);
        out.resize(static_cast<size_t>(size));
        return out;
    };
    const Bytes start{0, 0, 0, 1}, pps{0x68, 0xCE, 0x3C, 0x80};
    const Bytes sps{0x67, 0x42, 0xC0, 0x28, 0xDA, 0x01, 0xE0, 0x08, 0x9F, 0x95, 0x10};
    const Bytes record = AvcRecord({sps}, {pps}), expected = Concat({start, sps, start, pps});
    EXPECT_EQ(convert(record, 23), expected);
    EXPECT_EQ(convert(record, 22), Bytes());
    EXPECT_EQ(convert(Concat({record, {0xFD, 0xF8, 0xF8, 0}}), 128), expected);
    EXPECT_EQ(convert(AvcRecord({sps, pps}, {pps, sps}), 128),
              Concat({start, sps, start, pps, start, pps, start, sps}));
    EXPECT_EQ(convert(AvcRecord({}, {pps}), 128), Concat({start, pps}));
    EXPECT_EQ(convert(AvcRecord({}, {}), 128), Bytes());
    EXPECT_EQ(convert(AvcRecord({sps}, std::vector<Bytes>(129)), 1000).size(), 15u + 129 * 4);
    for (size_t length = 0; length < record.size(); ++length) // a count or a length that runs over the end
        EXPECT_EQ(convert(Bytes(record.data(), record.data() + length), 128), Bytes());
    EXPECT_EQ(convert(Concat({{0}, Bytes(record.begin() + 1, record.end())}), 128), Bytes()); // version
}

TEST(SequenceParameterSet, GivesThePictureSize)
{
    const auto size = [](const Bytes& set) { return ParseVideo(7, Concat({{0, 0, 0, 1}, set})); };
    const Bytes small{0x07, 0x42, 0xC0, 0x28, 0xDA, 0x05, 0x07, 0xE4};
    EXPECT_EQ(size(small), Video(0, 320, 240));
    EXPECT_EQ(size({0x67, 0x42, 0xC0, 0x28, 0xDA, 0x01, 0xE0, 0x08, 0x9F, 0x95, 0x10}), Video(0, 1920, 1080));
    EXPECT_EQ(size({0x67, 0x64, 0x00, 0x28, 0xAC, 0xB4, 0x03, 0xC0, 0x11, 0x3F, 0x2A, 0x11}), Video(0, 1920, 1080));
    EXPECT_EQ(size({0x67, 0x64, 0x00, 0x28, 0xAC, 0xB4, 0x03, 0xC0, 0x22, 0x3E, 0xD0}), Video(0, 1920, 1080));
    EXPECT_EQ(size({0x67, 0x64, 0, 0x28, 0xBC, 0xB4, 2, 0x80, 0x2D, 0xED, 0xB6, 0x80, 0x12}), Video(0, 1272, 716));
    EXPECT_EQ(size(Concat({{0x68, 0xCE, 0x3C, 0x80, 0, 0, 1}, small})), Video(0, 320, 240));
    EXPECT_EQ(size({0x68, 0xCE, 0x3C, 0x80, 0, 0, 1, 0x67}), NO_VIDEO);
    EXPECT_EQ(size({0x67, 0x42, 0, 0}), Video(0, 0, 0)); // what is missing reads as zeros
    // From its profile to level, from the identifier on, from the picture order type on, from the width on.
    const auto fields = [&size](const std::string& profile, const std::string& id, const std::string& order,
                                const std::string& rest) {
        return size(Concat({{0x67}, Bits({profile + "/8 0/16", id, "4", order, "1 1/1", rest, "255/8"})}));
    };
    const std::string frames = "19 14 3/2 1/1 1 2 3 4", order = "2";
    const Video cropped[] = {{0, 317, 233}, {0, 314, 226}, {0, 314, 233}, {0, 317, 233}, {0, 317, 233}};
    const auto high = [](uint32_t chroma) {
        return "0 " + std::to_string(chroma) + (chroma == 3 ? " 1/1" : "") + " 2 2 1/1 ";
    };
    for (uint32_t chroma = 0; chroma < 5; ++chroma)
        for (const char* const profile : {"100", "110", "122", "144"})
            EXPECT_EQ(fields(profile, high(chroma) + "0/1", order, frames), cropped[chroma]);
    for (const char* const profile : {"0", "44", "66", "77", "83", "86", "88", "118", "128", "244"})
        EXPECT_EQ(fields(profile, "0", order, frames), cropped[1]);
    EXPECT_EQ(fields("100", high(2) + "0/1", order, "19 14 0/1 1/1 0/1 1/1 1 2 3 4"), Video(0, 314, 480 - 2 * 7));
    EXPECT_EQ(fields("66", "0", order, "19 14 3/2 0/1 1 2 3 4"), Video(0, 320, 240));
    // Scaling lists: whole ones, absent ones, and those that end early, one by wrapping round.
    const auto repeat = [](const std::string& text, int count) {
        std::string out;
        for (; count != 0; --count)
            out += text;
        return out;
    };
    const std::string four = repeat("+3 -3 ", 8), eight = repeat("+3 -3 ", 32);
    const std::string lists = "1/1 1/1 " + four + "0/1 1/1 -8 1/1 +248 1/1 +2 -10 1/1 " + four + "1/1 " + eight + "0/1";
    EXPECT_EQ(fields("100", high(1) + lists, order, frames), cropped[1]);
    EXPECT_EQ(fields("66", "0", "0 4", frames), cropped[1]);
    EXPECT_EQ(fields("66", "0", "1 0/1 -3 +5 0", frames), cropped[1]);
    EXPECT_EQ(fields("66", "0", "1 0/1 -3 +5 255 " + repeat("-9 ", 255), frames), cropped[1]);
    EXPECT_EQ(fields("66", "0", "1 0/1 -3 +5 256 " + repeat("-9 ", 256), frames), NO_VIDEO);
    // The longest code, one too long, and 00 00 03 with its 03.
    EXPECT_EQ(fields("66", "0/31 1/1 5/31", order, frames), cropped[1]);
    EXPECT_EQ(fields("66", "0/32", order, frames), cropped[1]);
    EXPECT_EQ(fields("66", "0", order, "0/32 14 3/2 0/1"), Video(0, 0, 240));
    EXPECT_EQ(fields("66", "1/7 32/6", order, frames), cropped[1]);
}

// What an open learns of the stream of some tags: code, sizes, bytes of its configuration.
std::string Probe(const std::vector<Tag>& tags)
{
    const bool video = tags[0].type == 9;
    FlvBuilder builder;
    builder.add(video ? Tag{8, 0, AudioData(SOUND_PCM, Noise(50))} : Tag{9, 0, VideoData(1, CODEC_SCREEN, Noise(50))});
    for (const Tag& tag : tags)
        builder.add(tag);
    FakeHost host(builder.build().bytes);
    host.start_log(true);
    const Session session(host);
    EXPECT_TRUE(session.opened());
    EXPECT_EQ(host.take_log().find("alloc(42949"), std::string::npos); // no negative size
    const auto& [info, sound] = std::tie(session.ctx()->video_info, session.ctx()->audio_info);
    std::ostringstream out;
    if (video)
        out << std::string(info.fourcc, 4).c_str() << ' ' << info.width << 'x' << info.height;
    else
        out << sound.format_tag << ' ' << sound.sample_rate << 'x' << sound.channels << ' ' << sound.data_rate;
    out << ' ' << (video ? info.config_size : sound.config_size);
    return out.str();
}

TEST(StreamProbe, DescribesTheFirstTag)
{
    const Bytes noise = Noise(200), record = SmallAvcRecord();
    const auto picture = [](uint8_t codec, const Bytes& payload) { return Tag{9, 0, VideoData(1, codec, payload)}; };
    const auto avc = [](const Bytes& config) { return Tag{9, 0, AvcConfig(config)}; };
    const auto sound = [](const Bytes& data) { return Tag{8, 0, data}; };
    const auto parameters = [&avc](uint8_t size) { // in start-code form
        return avc(AvcRecord({{0x67, 0x42, 0xC0, 0x28, 0xDA, 0x05, 0x07, 0xE4}}, {Noise(size_t{size} - 16)}));
    };
    EXPECT_EQ(Probe({parameters(128)}), "H264 320x240 131");
    EXPECT_EQ(Probe({parameters(129)}), " 0x0 132");
    EXPECT_EQ(Probe({picture(0, noise)}), " 0x0 0");
    EXPECT_EQ(Probe({picture(1, noise)}), "JPEG 0x0 0");
    EXPECT_EQ(Probe({picture(2, H263Picture(3))}), "FLV1 176x144 0");
    EXPECT_EQ(Probe({picture(3, noise)}), "SCR1 0x0 0");
    EXPECT_EQ(Probe({picture(4, Vp6Picture(false, 20, 15))}), "VP60 320x240 0");
    EXPECT_EQ(Probe({picture(5, Vp6Picture(true, 20, 15))}), "VP6A 320x240 0");
    EXPECT_EQ(Probe({picture(6, noise)}), "SCR2 0x0 0");
    EXPECT_EQ(Probe({picture(8, noise)}), " 0x0 0");
    EXPECT_EQ(Probe({avc(record)}), "H264 320x240 " + std::to_string(record.size()));
    const Tag damaged = avc({1, 66, 0, 40, 0xFF, 0xE1, 0, 9, 0}), large = avc(Noise(5000)), tiny{9, 0, {0x17, 0}};
    EXPECT_EQ(Probe({damaged}), " 0x0 9");
    EXPECT_EQ(Probe({damaged, large}), " 0x0 9"); // stays until the bytes of the next are there
    EXPECT_EQ(Probe({damaged, large, tiny}), " 0x0 0");
    EXPECT_EQ(Probe({damaged, avc(record)}), "H264 320x240 " + std::to_string(record.size()));
    EXPECT_EQ(Probe({sound(AacConfig({0x11, 0x90}))}), "43712 48000x2 0 2"); // 0xAAC0
    EXPECT_EQ(Probe({sound(AacConfig({}))}), "43712 96000x0 0 0");
    EXPECT_EQ(Probe({sound(AacRaw(noise, 0xAA))}), "43712 22050x1 0 0");
    EXPECT_EQ(Probe({sound(AudioData(SOUND_MP3, Mp3Frame()))}), "85 44100x2 128 0");
    EXPECT_EQ(Probe({sound({0xEE, 0xFF, 0xFD, 0x90, 0xC4})}), "85 44100x1 160 0"); // layer II
    EXPECT_EQ(Probe({sound(AudioData(0x32, noise))}), "0 5500x1 0 0");
    EXPECT_EQ(Probe({sound(AudioData(0x35, noise))}), "0 11025x2 0 0");
}

// AMF0 from a text. Numbers, n for NaN; 'text'; "long string"; {key:value …} object; <key:value …> ECMA array;
// [value …] strict array; %byte.byte… as they are; ! a long string that fails right behind its length. The key * has
// 256 letters.
Bytes Amf(std::istream& in)
{
    char c = 0;
    std::string text;
    uint32_t number = 0;
    double value = std::nan("");
    std::vector<amf::Property> properties;
    Bytes out;
    in >> c;
    switch (c) {
    case '\'':
    case '"':
        std::getline(in, text, c);
        return c == '"' ? amf::LongString(text) : amf::String(text);
    case '!':
        return {12, 0x7F, 0xFF, 0xFF, 0xFB};
    case '%':
        for (in >> number; in.peek() == '.'; in.get() && in >> number)
            Put(out, number, 1);
        Put(out, number, 1);
        return out;
    case '[':
        for (; (in >> std::ws).peek() != ']'; ++number)
            Append(out, Amf(in));
        in.get();
        return Concat({amf::StrictArray({}, number), out});
    case '{':
    case '<':
        while ((in >> std::ws).peek() != (c == '{' ? '}' : '>')) {
            std::getline(in, text, ':');
            properties.emplace_back(text == "*" ? std::string(256, 'k') : text, Amf(in));
        }
        in.get();
        return c == '{' ? amf::Object(properties) : amf::EcmaArray(properties, 9);
    default:
        c == 'n' ? in : in.putback(c) >> value;
        return amf::Number(value);
    }
}
Bytes Amf(const std::string& text)
{
    Bytes out;
    for (std::istringstream in(text); (in >> std::ws).peek() != EOF;)
        Append(out, Amf(in));
    return out;
}

constexpr int64_t START = 30;
constexpr uint32_t IN_MEMORY = FLVD_OPT_INDEX_IN_MEMORY;

// Script data in a file, other bytes around it, and a fresh instance to read it into.
class Script {
public:
    explicit Script(const Bytes& payload, uint32_t options = 0)
        : host(Concat({Bytes(START), payload, Bytes(20, 0xEE)})), m_size(static_cast<uint32_t>(payload.size()))
    {
        const fio_funcs_t funcs = host.funcs();
        const flvd_init_t init = host.init();
        __FLV_DMX__fioSetFunc(&funcs);
        FLVD_SetCallbackforMeta(&init);
        ctx.cur_reader = __FLV_DMX__fioOpen(FakeHost::DEFAULT_FILE, FIO_MODE_READ | FIO_MODE_BINARY, 4096, 0, 0);
        ctx.options = options;
        __FLV_DMX__fioSeek64(ctx.cur_reader, START, FIO_SEEK_SET);
    }
    ~Script()
    {
        host.funcs().mem_free(ctx.keyframe_arrays.times_ms);
        host.funcs().mem_free(ctx.keyframe_arrays.positions);
        __FLV_DMX__fioClose(ctx.cur_reader);
    }
    FakeHost host;
    flvd_ctx_t ctx{};
    // Reads `length` bytes, all by default, and ends behind them whatever the result.
    int32_t read(uint32_t length)
    {
        EXPECT_EQ(__FLV_DMX__fioSeek64(ctx.cur_reader, START, FIO_SEEK_SET), 0);
        host.reset_calls();
        const int32_t rc = FLVD_ReadMetadata(&ctx, length);
        host.fail_nothing();
        EXPECT_EQ(__FLV_DMX__fioTell64(ctx.cur_reader), START + length);
        return rc;
    }
    int32_t read() { return read(m_size); }
    // What is not 0 in the instance.
    std::string fields() const
    {
        const auto& [video, audio, index] = std::tie(ctx.video_info, ctx.audio_info, ctx.keyframe_index);
        const std::pair<const char*, int64_t> all[] = {
            {"width", video.width},          {"height", video.height},          {"rate", video.frame_rate},
            {"delay", ctx.audio_delay_ms},   {"kbits", audio.data_rate},        {"hertz", audio.sample_rate},
            {"bits", audio.sample_size},     {"key at", ctx.last_keyframe_pos}, {"key ms", ctx.last_keyframe_ms},
            {"and", video.last_key_time_ms}, {"size", ctx.file_size},           {"shorter", ctx.file_shorter_than_meta},
            {"entries", index.entry_count},  {"T", index.times_offset},         {"P", index.positions_offset}};
        std::ostringstream out;
        for (const auto& [name, value] : all)
            if (value != 0)
                out << ' ' << name << ' ' << value;
        for (uint32_t i = 0; i < ctx.keyframe_arrays.times_count; ++i)
            out << (i == 0 ? " times " : ",") << ctx.keyframe_arrays.times_ms[i];
        for (uint32_t i = 0; i < ctx.keyframe_arrays.positions_count; ++i)
            out << (i == 0 ? " positions " : ",") << ctx.keyframe_arrays.positions[i];
        return out.str();
    }

private:
    uint32_t m_size;
};

// Result and fields.
std::string Read(const std::string& text, uint32_t options = 0, int64_t file_size = 0, uint32_t length = 0)
{
    Script script(Amf(text), options);
    script.ctx.file_size = file_size;
    const int32_t rc = length != 0 ? script.read(length) : script.read();
    return std::to_string(rc) + script.fields();
}

TEST(ScriptValue, IsConsumedByItsType)
{
    const std::string t255(255, 't'), t256(256, 't'), t64k(65535, 't');
    std::vector<Bytes> values;
    const std::string date = "%11.0.0.0.0.0.0.0.0.0.0", movie = "%4.0.2.9.9";
    for (const std::string& text :
         {"1"s, "%1.1"s, "%7.0.7"s, date, movie, "''"s, "\"\""s, "{}"s, "{a:1 b:{}}"s, "<>"s, "[]"s,
          "[1 {} 'x' <a:%1.0>]"s, "'" + t255 + "'", "'" + t256 + "'", "'" + t64k + "'", "\"" + t64k + "\""})
        values.push_back(Amf(text));
    for (const Bytes& head : {Bytes{3}, {8, 0, 0, 0, 0}}) // an empty key ends it unconsumed; here it begins a number
        values.push_back(Concat({head, {0, 1, 'a', 1, 1}, {0, 0, 1, 2, 3, 4, 5, 6, 7}}));
    for (const Bytes& value : values) {
        Script script(Concat({value, Amf("<width:320>")}));
        EXPECT_EQ(script.read(), 0);
        EXPECT_EQ(script.fields(), " width 320") << int{value[0]};
        EXPECT_TRUE(value.size() > 4096 || script.host.calls(HostFn::Seek) == 0) << int{value[0]};
    }
    // What yields nothing ends the parse.
    for (const char* const value : {"%5", "%6", "%9", "%13", "%14", "%17", "%255", "!", "<a:!>", "{a:!}", "[!]"}) {
        EXPECT_EQ(Read(value + "<width:320>"s), "-1") << value;
        EXPECT_EQ(Read("'onMetaData' <height:240> "s + value + "<width:320>"), "0 height 240") << value;
    }
    EXPECT_EQ(Read("<a:%5 width:320 b:{c:%6 height:240}>"), "0 width 320 height 240");
    // A long string that is itself the largest value: what holds it is too large.
    EXPECT_EQ(Read("'onMetaData' <width:320 a:%12.127.255.255.250>"), "0 width 320");
}

TEST(ScriptValue, NestsToADepthOf64)
{
    const auto nested = [](size_t containers, const std::string& value) {
        return std::string(containers, '[') + value + std::string(containers, ']');
    };
    EXPECT_EQ(Read(nested(63, "<width:320>") + nested(63, "<height:240>")), "0 width 320 height 240");
    EXPECT_EQ(Read(nested(64, "<width:320>")), "-1");
}

TEST(ScriptValue, MayBeCutAnywhere)
{
    const Bytes all = Amf("'onMetaData' <width:1 keyframes:{times:[1 2] filepositions:[3 4]} a:%11.0.0.0.0.0.0.0.0.0.0 "
                          "b:\"text\" c:{d:{e:%7.0.1}} height:2>");
    const auto read = [&all](uint32_t length, const std::function<void(FakeHost&)>& prepare) {
        Script script(all, IN_MEMORY);
        prepare(script.host);
        return script.read(length);
    };
    const auto size = static_cast<uint32_t>(all.size());
    for (uint32_t cut = 1; cut < size; ++cut) {
        SCOPED_TRACE(cut);
        EXPECT_EQ(read(cut, [](FakeHost&) {}), 0); // the text that stands first may run over the end
        EXPECT_EQ(read(size, [cut](FakeHost& host) { host.set_visible(START + cut); }), cut < 13 ? -1 : 0);
        EXPECT_LE(read(size, [cut](FakeHost& host) { host.limit_reads(cut); }), 0);
    }
    EXPECT_EQ(Script(all).read(0), -1);
    EXPECT_EQ(Read("<width:320>", 0, 0, 12), "-1"); // a value begins inside or not at all
    EXPECT_EQ(Read("<width:320>", 0, 0, 13), "0 width 320");
    EXPECT_EQ(Read("{a:%5} 1", 0, 0, 16), "0"); // more consumed than counted
    // An array of two ends with a failed ECMA array, but not with a failed object.
    const std::string after = "0.1.97 !<width:320>";
    EXPECT_EQ(Read("%10.0.0.0.2.8.0.0.0.0." + after), "-1");
    EXPECT_EQ(Read("%10.0.0.0.2.3." + after), "0 width 320");
    const auto fail = [](const char* text, HostFn fn) {
        Script script(Amf(text));
        script.host.reset_calls();
        script.host.fail_nth(fn, 1);
        return FLVD_ReadMetadata(&script.ctx, 3);
    };
    EXPECT_EQ(fail("%5 %5 %5", HostFn::Seek), FLVD_ERR_END_OF_DATA);
    EXPECT_EQ(fail("'text'", HostFn::Seek), 0); // a seek back from behind the payload does not count
    EXPECT_EQ(fail("'text'", HostFn::Tell), -1);
}

TEST(ScriptKey, MatchesInAnyCaseAndAtAnyDepth)
{
    for (const std::string& key : {"width"s, "Width"s, "WIDTH"s, "wIDth"s})
        EXPECT_EQ(Read("<" + key + ":55 height:66>"), "0 width 55 height 66");
    for (const std::string& key :
         {"widt"s, "widths"s, "xidth"s, "*"s, "wid\0h"s, "width\0"s, std::string(22, 'w'), std::string(255, 'w')})
        EXPECT_EQ(Read("<" + key + ":55 height:66>"), "0 height 66") << key;
    EXPECT_EQ(Read("[{x:<y:[{width:7}]>}]"), "0 width 7");
}

TEST(ScriptKey, TakesTheNumberIntoItsField)
{
    EXPECT_EQ(Read("<width:320.9 height:240 framerate:29.97 audiodelay:1.001>"),
              "0 width 320 height 240 rate 29970 delay 1000");
    EXPECT_EQ(Read("<audiodatarate:128.7 audiosamplerate:44100 audiosamplesize:16>"),
              "0 kbits 128 hertz 44100 bits 16");
    EXPECT_EQ(Read("<width:-5 height:n framerate:-1e300 audiodelay:-0.5>"), "0");
    EXPECT_EQ(Read("<width:1e300 height:4294967296 framerate:1e7 lastkeyframetimestamp:2.5>"),
              "0 width 4294967295 height 4294967295 rate 4294967295 key ms 2500 and 2500");
    EXPECT_EQ(Read("<width:4294967295 lastkeyframelocation:5e9>"), "0 width 4294967295 key at 5000000000");
    EXPECT_EQ(Read("<lastkeyframelocation:-5.9>"), "0 key at -5");
    EXPECT_EQ(Read("<lastkeyframelocation:n>"), "0");
    EXPECT_EQ(Read("<lastkeyframelocation:1e300>"), "0 key at 9223372036854775807");
    EXPECT_EQ(Read("<lastkeyframelocation:-1e300>"), "0 key at -9223372036854775808");
    EXPECT_EQ(Read("<duration:5 lasttimestamp:6 totalduration:7 other:8>"), "0");
    EXPECT_EQ(Read("<filesize:10000000>"), "0 size 10000000");
    EXPECT_EQ(Read("<filesize:5e9>"), "0 size 4294967295");
    EXPECT_EQ(Read("<filesize:100>", 0, 100), "0 size 100");
    EXPECT_EQ(Read("<filesize:101>", 0, 100), "0 size 100 shorter 1");
}

TEST(ScriptKey, TakesWhatTheSlotHolds)
{
    // 2^52: the lowest bytes of such a double are its units.
    const auto key_at = [](const std::string& value) {
        return Read("<duration:4503599627370496 lastkeyframelocation:" + value + " height:9>");
    };
    const std::string same = "0 height 9 key at 4503599627370496";
    for (const char* const value : {"'abc'", "%5", "%11.0.0.0.0.0.0.0.0.0.1", "{}", "{other:1}", "\"\""})
        EXPECT_EQ(key_at(value), same) << value;
    EXPECT_EQ(key_at("{*:!}"), "0 key at 4503599627370496"); // a failed object's end marker ends what encloses it
    EXPECT_EQ(key_at("%1.5"), "0 height 9 key at 4503599627370501");
    EXPECT_EQ(key_at("%7.1.2"), "0 height 9 key at 4503599627370754");
    EXPECT_EQ(key_at("[4503599627370497 3]"), "0 height 9 key at 3");
    EXPECT_EQ(key_at("{*:4}"), "0 height 9 key at 4"); // a key of that length is not looked up
    EXPECT_EQ(key_at("{" + std::string(255, 'k') + ":4}"), same);
    EXPECT_EQ(key_at("{width:4}"), "0 width 4 height 9"); // the inner key takes the place of the outer one
    EXPECT_EQ(Read("<duration:12.5 width:'abc'>"), "0 width 12");
}

TEST(KeyframeIndex, CountsWhatBothArraysHave)
{
    // Offsets are those of the first elements, 30 bytes into the file.
    EXPECT_EQ(Read("{keyframes:{times:[1 2 3 4] filepositions:[5 6 7]}}"), "0 entries 3 T 55 P 111");
    EXPECT_EQ(Read("{keyframes:{times:[1 2 3] filepositions:[5 6 7 8]}}"), "0 entries 3 T 55 P 102");
    EXPECT_EQ(Read("{KeyFrames:{Times:[1 2 3 4]}}"), "0 entries 4 T 55");
    EXPECT_EQ(Read("{times:[1 2 3] filepositions:[5 6 7 8]}"), "0");
    EXPECT_EQ(Read("{keyframes:1}"), "0 entries 4294967295");
    EXPECT_EQ(Read("{a:[1 2] keyframes:{times:1 filepositions:[5]}}"), "0 T 81 P 105");
    EXPECT_EQ(Read("{keyframes:{times:[1 2] filepositions:[5 6]} times:[1]}"),
              "0 entries 1 T 55 P 93"); // no offset any more
    Script script(Amf("{keyframes:{times:[1 2] filepositions:[5 6]}}"));
    script.host.fail_nth(HostFn::Tell, 2);
    script.read();
    EXPECT_EQ(script.fields(), " entries 2 P 93");
}

TEST(KeyframeArray, HoldsWhatCanBeStored)
{
    const auto arrays = [](const std::string& times, const std::string& positions, uint32_t options = IN_MEMORY) {
        const std::string out = Read("{keyframes:{times:" + times + " filepositions:" + positions + "}}", options);
        return out.substr(std::min(out.size(), out.find("times")));
    };
    EXPECT_EQ(arrays("[0 2.5 5]", "[13 5000 9000]"), "times 0,2500,5000 positions 13,5000,9000");
    EXPECT_EQ(arrays("[0 2.5 5]", "[13 5000 9000]", FLVD_OPT_PROGRESSIVE), "times 0,2500,5000 positions 13,5000,9000");
    EXPECT_EQ(arrays("[1.001 -5 n 1e300]", "[-5.9 n 1e300 -1e300]"),
              "times 1000,0,0,4294967295 positions -5,0,9223372036854775807,-9223372036854775808");
    EXPECT_EQ(Read("[1 2]", IN_MEMORY), "0");
    EXPECT_EQ(arrays("[1 'x' %5 2]", "1"), "times 1000,1000,1000,2000");
    EXPECT_EQ(arrays("[1 1 ! 1]", "1"), "times 1000,1000,0,0"); // cut short
    EXPECT_EQ(arrays("[1]", "[1 ! 1]"), "times 1000 positions 1,0,0");
    EXPECT_EQ(arrays("[1 {times:[7]} 1 1]", "1"), "times 7000"); // replaced by its own element
    EXPECT_EQ(arrays("[1 {times:[7 8 9 9]} 5]", "1"), "times 7000,9000,5000,9000");
    EXPECT_EQ(arrays("[1]", "[1 {filepositions:[7]} 2 3]"), "times 1000 positions 7");
}

TEST(KeyframeArray, IsNotAllocatedForACountThatLies)
{
    // Entries kept and allocations asked for, when five bytes of values follow.
    const auto kept = [](const std::string& key, uint32_t count, uint32_t length) {
        Bytes payload = Amf("<" + key + ":[]>");
        payload.resize(payload.size() - 7);
        Put(payload, count, 4);
        Append(payload, Bytes(5, 5));
        Script script(payload, IN_MEMORY);
        EXPECT_EQ(length != 0 ? script.read(length) : script.read(), -1);
        const uint64_t entries = script.ctx.keyframe_arrays.times_count + script.ctx.keyframe_arrays.positions_count;
        return std::pair(entries, script.host.calls(HostFn::Alloc));
    };
    using Kept = std::pair<uint64_t, uint64_t>;
    constexpr uint32_t endless = 0xFFFFFFF0;
    for (const std::string& key : {"times"s, "filepositions"s}) {
        EXPECT_EQ(kept(key, 5, 0), Kept(5, 1));
        EXPECT_EQ(kept(key, 6, 0), Kept(0, 0));
        const uint32_t most = key == "times" ? 0x3FFFFFFF : 0x1FFFFFFF; // of which the bytes can be counted
        EXPECT_EQ(kept(key, most, endless), Kept(0, 1));
        EXPECT_EQ(kept(key, most + 1, endless), Kept(0, 0));
    }
    // Arrays one inside the other, each claiming the rest: two and a half payloads of elements are too many.
    const auto allocations = [](uint32_t arrays) {
        Bytes payload;
        for (uint32_t left = 200 + 13 * arrays; left > 200;) {
            Append(payload, {3, 0, 5, 't', 'i', 'm', 'e', 's', 10});
            Put(payload, left -= 13, 4);
        }
        payload.resize(payload.size() + 200, 5);
        Script script(payload, IN_MEMORY);
        script.read();
        return script.host.calls(HostFn::Alloc);
    };
    EXPECT_EQ(std::tuple(allocations(1), allocations(2), allocations(3)), std::tuple(1u, 2u, 2u));
}

TEST(KeyframeArray, IsReplacedByTheNext)
{
    Script script(Amf("<keyframes:{times:[1 2] filepositions:[3 4]} width:5>"), IN_MEMORY);
    EXPECT_EQ(script.read(), 0);
    script.host.start_log(true);
    EXPECT_EQ(script.read(), 0);
    const std::string log = script.host.take_log(), step = "free(1)= alloc(";
    EXPECT_LT(log.find(step + "8)=1"), log.find(step + "16)=1"));
    EXPECT_NE(log.find(step + "16)=1"), std::string::npos);
    script.host.fail_from(HostFn::Alloc, 1);
    EXPECT_EQ(script.read(), 0);
    EXPECT_EQ(script.fields(), " width 5 entries 2 T 59 P 97");
    EXPECT_EQ(script.ctx.keyframe_arrays.times_ms, nullptr);
}

} // namespace
