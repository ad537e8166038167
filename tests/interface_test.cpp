// The C++ interface: what it adds to the C interface, on samples with known contents and on files in memory.

#include "flvdmx/callback_host.h"
#include "flvdmx/flvdmx.hpp"
#include "flvdmx/memory_host.h"
#include "flvdmx/posix_host.h"
#include "support/expected.h"
#include "support/report.h"
#include "support/session.h"
#include "support/sweep.h"

#include <algorithm>
#include <cerrno>
#include <sstream>

#include <boost/crc.hpp>

using namespace flvd_test;
using namespace std::chrono_literals;
using flvdmx::Kind, flvdmx::SeekMode, flvdmx::Stream;

namespace {

const std::string g_data = FLVDMX_TEST_DATA "/";
const flvdmx::Host g_memory = flvdmx::make_host(flvd_memory_host_fill);

struct Memory : flvd_memory_file_t {
    Memory(const char* path, const Bytes& bytes) : flvd_memory_file_t{path, bytes.data(), bytes.size(), nullptr}
    {
        flvd_memory_host_add(this);
    }
    ~Memory() { flvd_memory_host_remove(this); }
};

// All that is told of a frame, in a line. Times in ms: decoding, presentation.
std::string Line(Stream stream, int64_t time, int64_t presentation, bool keyframe, int64_t position, const Bytes& data)
{
    boost::crc_32_type crc;
    crc.process_bytes(data.data(), data.size());
    std::ostringstream line;
    line << (stream == Stream::video ? "video " : "audio ") << time << ' ' << presentation << (keyframe ? " key" : "")
         << " @" << position << ' ' << data.size() << " bytes " << crc.checksum();
    return line.str();
}

std::string Line(const flvdmx::Frame& frame)
{
    return Line(frame.stream, frame.time.count(), frame.presentation_time().count(), frame.keyframe, frame.position,
                Bytes(frame.data.begin(), frame.data.end()));
}

using Lines = std::vector<std::string>;

// What the prober found of the streams asked for, in a sample that begins at 0 ms.
Lines ExpectedLines(const Expected& sample, Stream asked = Stream::any)
{
    Lines lines;
    for (size_t i = 0; i < sample.tags.size(); ++i) {
        const Tag& tag = sample.tags[i];
        const Bytes data(tag.data.begin() + static_cast<std::ptrdiff_t>(tag.codec_bytes()), tag.data.end());
        if (asked == Stream::any || static_cast<uint32_t>(asked) == tag.stream())
            lines.push_back(Line(static_cast<Stream>(tag.stream()), tag.timestamp, sample.packets[i].presentation,
                                 sample.packets[i].keyframe, tag.offset, data));
    }
    return lines;
}

// Times in ms and positions.
using Keyframes = std::vector<std::pair<int64_t, int64_t>>;

Keyframes List(const flvdmx::result<std::vector<flvdmx::Keyframe>>& list)
{
    Keyframes keyframes;
    for (const flvdmx::Keyframe& keyframe : *list)
        keyframes.emplace_back(keyframe.time.count(), keyframe.position);
    return keyframes;
}

// A range-for over the frames of a file that is gone by then does not compile.
template <typename R, typename = void> constexpr bool g_has_frames = false;
template <typename R> constexpr bool g_has_frames<R, std::void_t<decltype(std::declval<R>()->frames())>> = true;
static_assert(g_has_frames<flvdmx::result<flvdmx::File>&> && !g_has_frames<flvdmx::result<flvdmx::File>>);

void ExpectDescribed(const flvdmx::Info& info, const ExpectedStream& stream)
{
    static const std::map<std::string, std::string> names = {
        {"h264", "H.264 (AVC)"}, {"flv1", "Sorenson H.263"},          {"flashsv", "screen video"}, {"aac", "AAC"},
        {"mp3", "MP3"},          {"pcm_s16le", "PCM, little-endian"}, {"speex", "Speex"}};
    const bool video = stream.stream == FLVD_STREAM_VIDEO;
    ASSERT_TRUE(video ? info.video.has_value() : info.audio.has_value());
    EXPECT_EQ(video ? name(info.video->codec) : name(info.audio->codec), names.at(stream.codec));
    EXPECT_EQ(video ? info.video->config : info.audio->config, stream.extradata);
    const bool known = stream.codec != "speex"; // whose rate is not in the file
    EXPECT_EQ(video ? info.video->width : info.audio->sample_rate, video   ? stream.width
                                                                   : known ? stream.sample_rate
                                                                           : 11025);
}

class Sample : public testing::TestWithParam<std::string> {};
// All frames and what is known of the file, against what another demuxer found: one reader, and two with an own buffer;
// complete and growing. The lists that are asked for in the middle leave the frames as they are.
TEST_P(Sample, IsDescribedAndPlayed)
{
    const Expected expected = ReadExpected(GetParam());
    Keyframes keyframes;
    for (size_t i = 0; i < expected.tags.size(); ++i)
        if (expected.tags[i].type == 9 && expected.packets[i].keyframe)
            keyframes.emplace_back(expected.tags[i].timestamp, expected.tags[i].offset);
    Bytes buffer(1u << 16);
    const flvdmx::Options apart = {0, 2000, true, false, true, false, buffer.data(), 1u << 16};
    for (const bool growing : {false, true})
        for (const Stream asked : {Stream::any, Stream::video, Stream::audio}) {
            if (growing && GetParam() == "damaged")
                continue; // nothing tells damage from what has not been written yet
            SCOPED_TRACE(testing::Message() << static_cast<uint32_t>(asked) << (growing ? " growing" : ""));
            flvdmx::Options options = asked == Stream::any ? flvdmx::Options() : apart;
            options.growing = growing;
            auto file = flvdmx::File::open(g_data + GetParam() + ".flv", options);
            ASSERT_TRUE(file) << file.error().text();
            const flvdmx::Info info = file->info();
            EXPECT_EQ(info.size, growing ? 0 : expected.size());
            EXPECT_EQ(info.start_time, 0ms);
            for (const ExpectedStream& stream : expected.streams)
                ExpectDescribed(info, stream);
            flvdmx::File moved(std::move(*file));
            const Lines wanted = ExpectedLines(expected, asked);
            Lines lines;
            for (auto frame = moved.next_frame(asked); frame; frame = moved.next_frame(asked)) {
                lines.push_back(Line(*frame));
                if (lines.size() != wanted.size() / 2)
                    continue;
                const Keyframes list = List(moved.keyframes());
                const bool by_index = info.seek_method == flvdmx::SeekMethod::by_index; // whose times are the index's
                EXPECT_EQ(list.size(), keyframes.size());
                EXPECT_TRUE(by_index || list == keyframes);
                const auto metadata = moved.metadata();
                EXPECT_NE(metadata->find(info.video ? "width" : "audiocodecid"), nullptr);
            }
            EXPECT_EQ(lines, wanted);
            EXPECT_EQ(moved.last_error().kind(), wanted.empty() ? Kind::failed : growing ? Kind::not_yet : Kind::end);
        }
}
INSTANTIATE_TEST_SUITE_P(Interface, Sample,
                         testing::Values("aac_only", "avc_aac", "avc_aac_index", "avc_bframes_aac", "avc_only",
                                         "damaged", "h263_mp3", "mp3_only", "pcm_only", "screen", "speex_only",
                                         "truncated"));

// What the fields hold beside the samples' values: negative offsets, FrameTypes, extended timestamps, a first timestamp
// that is not 0, script data and damage in between; sizes below and above the cache.
TEST(Interface, TellsOfEachFrame)
{
    const auto picture = [](uint32_t ts, int32_t offset, size_t size) {
        return Tag{9, ts, AvcNalu(false, Noise(size), offset)};
    };
    Tag bad = Raw(0x1000020);
    bad.back_pointer = 0;
    const Flv flv = File({g_meta, g_avc, g_aac, Nalu(0x1000000), picture(0x1000008, -8, 60), Raw(0x1000010), g_meta,
                          bad, picture(0x1000028, 0x7FFFFF, 5000), picture(0x1000030, -0x800000, 70000),
                          Raw(0x1000040, 0), Tag{9, 0x1000048, g_avc_end}, Nalu(0x1000050)});
    struct Wanted {
        size_t tag;
        int64_t time, offset;
        bool keyframe;
    };
    const Wanted wanted[] = {{3, 0, 0, true},           {4, 8, -8, false}, {5, 16, 0, true}, {8, 40, 0x7FFFFF, false},
                             {9, 48, -0x800000, false}, {10, 64, 0, true}, {12, 80, 0, true}};
    const Memory memory("memory", flv.bytes);
    for (const bool apart : {false, true}) {
        flvdmx::Options options;
        options.separate_audio_reader = apart;
        auto file = flvdmx::File::open("memory", g_memory, options);
        EXPECT_EQ(file->info().start_time.count(), 0x1000000);
        for (const Wanted& frame : wanted) {
            const Tag& tag = flv.tags[frame.tag];
            const auto got = file->next_frame(static_cast<Stream>(tag.stream()));
            EXPECT_EQ(got->time.count(), frame.time);
            EXPECT_EQ(got->composition_offset.count(), frame.offset) << frame.tag;
            EXPECT_EQ(got->keyframe, frame.keyframe) << frame.tag;
            EXPECT_EQ(got->position, tag.offset) << frame.tag;
        }
    }
}

// Configurations by their letters: of AVC the capitals, of AAC the small ones. L does not fit the cache, X is too long.
Bytes ConfigOf(char letter)
{
    Bytes config = letter < 'a' ? SmallAvcRecord() : Bytes{0x12, 0x10};
    config.push_back(static_cast<uint8_t>(letter));
    config.resize(letter == 'X' ? 65537 : letter == 'L' ? 5000 : config.size());
    return config;
}

// A dot for none.
char LetterOf(const flvdmx::Bytes& config)
{
    for (const char letter : std::string("ABCLXabc"))
        if (ConfigOf(letter) == Bytes(config.begin(), config.end()))
            return letter;
    return '.';
}

// A file of configurations, pictures (1), sounds (2) and holes of zeros (#), one every 10 ms.
Flv ConfigFile(const std::string& letters)
{
    Tags tags;
    for (const char letter : letters) {
        const auto time = static_cast<uint32_t>(tags.size() * 10);
        tags.push_back(letter == '1'   ? Nalu(time)
                       : letter == '2' ? Raw(time)
                       : letter == '#' ? Pcm(time, 5 << 19)
                       : letter < 'a'  ? Tag{9, time, AvcConfig(ConfigOf(letter))}
                                       : Tag{8, time, AacConfig(ConfigOf(letter))});
    }
    Flv flv = File(tags);
    for (size_t i = 0; i < letters.size(); ++i)
        if (letters[i] == '#')
            std::fill_n(&flv.bytes[static_cast<size_t>(flv.tags[i].offset)], flv.tags[i].size(), uint8_t{0});
    return flv;
}

// Plays a file; returns its letters with that of each reported configuration at the frame that brings it.
std::string ReportedConfigs(flvdmx::File& file, const Flv& flv, const std::string& letters, bool apart,
                            const std::function<bool()>& wait)
{
    std::string reported(letters.size(), '.');
    for (const Stream stream : apart ? std::vector{Stream::video, Stream::audio} : std::vector{Stream::any})
        for (auto frame = file.follow(wait, stream); frame; frame = file.follow(wait, stream))
            for (size_t i = 0; i < letters.size() && frame->config_changed(); ++i)
                if (flv.tags[i].offset == frame->position)
                    reported[i] = LetterOf(frame->new_config);
    return reported;
}

// Below each file: what is reported when it is played, and when it is played again from the beginning.
TEST(Interface, ReportsChangedConfigurations)
{
    struct Case {
        const char *name, *file, *first, *again;
    };
    const Case cases[] = {
        {.name = "a copy of the configuration in force is no change",
         .file = "Aa12Aa12B212bB12AC12",
         .first = "..........B....b..C.",
         .again = "..Aa......B....b..C."},
        {.name = "no frame needs the one between", .file = "A1BA1B1", .first = "......B", .again = ".A....B"},
        {.name = "larger than the cache", .file = "A1L11B1", .first = "...L..B", .again = ".A.L..B"},
        {.name = "above 64 KiB", .file = "A11X1B1", .first = "......B", .again = ".A....B"},
        {.name = "after holes longer than a search", .file = "A121#B#12", .first = ".......B.", .again = ".A.....B."}};
    for (const Case& test : cases) {
        const Flv flv = ConfigFile(test.file);
        Memory memory("memory", flv.bytes);
        for (const auto& [apart, growing] : {std::pair(false, false), {false, true}, {true, false}, {true, true}}) {
            SCOPED_TRACE(testing::Message()
                         << test.name << (apart ? ", two readers" : "") << (growing ? ", growing" : ""));
            memory.size = growing ? static_cast<uint64_t>(flv.tags[3].end()) : flv.bytes.size();
            auto file = flvdmx::File::open("memory", g_memory, {1024, 0, apart, growing});
            const auto grow = [&] {
                EXPECT_FALSE(file->seek(1s)) << "which leaves everything as it was";
                memory.size = std::min<uint64_t>(memory.size + 7 + flv.bytes.size() / 200, flv.bytes.size());
                return memory.size < flv.bytes.size();
            };
            EXPECT_EQ(ReportedConfigs(*file, flv, test.file, apart, grow), test.first);
            if (growing)
                continue; // no seeking without an index
            ASSERT_TRUE(file->seek(0ms));
            EXPECT_EQ(ReportedConfigs(*file, flv, test.file, apart, grow), test.again);
        }
    }
}

// Into the caller's memory goes what follows a frame at once; a small tag that is damaged does not make the large frame
// after it be passed over. Nothing but damage is told from whole tags.
TEST(Interface, DeliversIntoTheCallersMemory)
{
    Tag bad = Nalu(80, 50);
    bad.back_pointer = 0;
    const Flv flv =
        File({g_avc, g_aac, Nalu(0), Raw(10), Nalu(40, 70000), bad, Nalu(120, 9000), Raw(130),
              Tag{9, 140, AvcConfig(ConfigOf('B'))}, Tag{18, 140, OnMetaData("width: 320")}, Nalu(160), Raw(170)});
    const Memory memory("memory", flv.bytes);
    Bytes spare(100'000), own;
    auto plain = flvdmx::File::open("memory", g_memory);
    auto file = flvdmx::File::open("memory", g_memory, {0, 0, false, false, false, false, spare.data(), 100'000});
    std::vector<int64_t> elsewhere;
    for (int64_t end = flv.tags[2].offset;;) {
        own.clear();
        const auto frame = file->next_frame_into([&own](uint32_t size) {
            own.resize(size);
            return own.data();
        });
        const auto wanted = plain->next_frame();
        ASSERT_EQ(bool(frame), bool(wanted));
        if (!frame)
            break;
        EXPECT_EQ(Line(*frame), Line(*wanted));
        EXPECT_EQ(frame->config_changed(), wanted->config_changed());
        EXPECT_EQ(file->has_whole_tags(end, frame->position), frame->time != 120ms) << frame->time.count();
        if (frame->data.data() != own.data())
            elsewhere.push_back(frame->time.count());
        end = __FLV_DMX__fioTell64(file->instance()->main_reader);
    }
    EXPECT_EQ(file->last_error().kind(), flvdmx::Kind::end);
    EXPECT_EQ(elsewhere, std::vector<int64_t>({0, 120, 160})); // after configurations, damage
}

// Seeks in between, and requests for the streams in turn. What playing has passed is known.
TEST(Interface, KnowsConfigurationsThatItHasPassed)
{
    // The last report up to a time.
    const auto play = [](flvdmx::File& file, int64_t to, Stream stream) {
        char reported = '.';
        for (auto frame = file.next_frame(stream); frame; frame = file.next_frame(stream)) {
            if (frame->config_changed())
                reported = LetterOf(frame->new_config);
            if (frame->time.count() >= to)
                break;
        }
        return reported;
    };
    const std::string nine(9, '1');
    const struct {
        const char* name;
        std::string file;
        bool apart;
        std::vector<std::tuple<int64_t, int64_t, Stream, char>> steps; // seek to, play to, report
    } cases[] = {{.name = "back to one that was passed twice",
                  .file = "A" + nine + "B" + nine + "A" + nine + "A" + nine,
                  .apart = false,
                  .steps = {{-1, 20, Stream::any, '.'},
                            {190, 350, Stream::any, '.'},
                            {90, 120, Stream::any, 'B'},
                            {250, 260, Stream::any, 'A'}}},
                 {.name = "what the other reader crosses is not passed",
                  .file = "Aa12bB21A12121212121212",
                  .apart = true,
                  .steps = {{-1, 100, Stream::audio, 'b'}, {150, 160, Stream::video, '.'}}}};
    for (const auto& test : cases) {
        SCOPED_TRACE(test.name);
        const Flv flv = ConfigFile(test.file);
        const Memory memory("memory", flv.bytes);
        auto file = flvdmx::File::open("memory", g_memory, {0, 0, test.apart});
        for (const auto& [from, to, stream, report] : test.steps) {
            EXPECT_TRUE(from < 0 || file->seek(std::chrono::milliseconds(from), SeekMode::backward));
            EXPECT_EQ(play(*file, to, stream), report) << to;
        }
    }
}

// A stream that begins after the tags that an open looks at: it is not in the information, its frames are whole.
TEST(Interface, DescribesFramesOfAStreamThatBeginsLate)
{
    const std::string letters = "a" + std::string(120, '2') + "A12";
    const Flv flv = ConfigFile(letters);
    const Memory memory("memory", flv.bytes);
    auto file = flvdmx::File::open("memory", g_memory);
    EXPECT_FALSE(file->info().video);
    const std::string wanted = std::string(letters.size() - 2, '.') + "A.";
    EXPECT_EQ(ReportedConfigs(*file, flv, letters, false, [] { return false; }), wanted);
}

// Of the changes that were forgotten a seek back reports none, rather than a wrong one.
TEST(Interface, ForgetsEarlyConfigurations)
{
    Tags tags;
    const auto config = [](uint32_t n) { return Concat({SmallAvcRecord(), BigEndian(n, 2)}); };
    for (uint32_t n = 0; n < 300; ++n)
        tags.insert(tags.end(), {Tag{9, n * 10, AvcConfig(config(n))}, Nalu(n * 10)});
    const Flv flv = File(tags);
    const Memory memory("memory", flv.bytes);
    auto file = flvdmx::File::open("memory", g_memory);
    const auto reported = [&] {
        const auto frame = file->next_frame();
        return Bytes(frame->new_config.begin(), frame->new_config.end());
    };
    EXPECT_EQ(reported(), Bytes());
    for (uint32_t n = 1; n < 300; ++n)
        EXPECT_EQ(reported(), config(n));
    ASSERT_TRUE(file->seek(500ms));
    EXPECT_EQ(reported(), Bytes());
    EXPECT_EQ(reported(), config(51));
    ASSERT_TRUE(file->seek(2800ms));
    EXPECT_EQ(reported(), config(280));
}

// Uses a host of which no call fails, and then hosts of which one call fails, each in turn.
void FailEachCall(const Bytes& bytes, const std::function<void(const flvdmx::Host& host)>& use)
{
    Sweep sweep;
    uint64_t calls = 1;
    for (uint64_t n = 0; n <= calls; ++n) {
        if (!sweep.takes_next() && n != 0)
            continue;
        SCOPED_TRACE(testing::Message() << "call " << n);
        FakeHost host(bytes);
        host.fail_nth_call(n);
        use(flvdmx::Host(host.init()));
        calls = n == 0 ? host.failable_calls() : calls;
        EXPECT_EQ(host.live_blocks(), 0u);
    }
}

// What decoders of video and audio have in the end, after a failed request or two.
std::pair<Bytes, Bytes> LastConfigs(flvdmx::File& file, bool apart)
{
    std::pair configs(file.info().video->config, file.info().audio->config);
    for (const Stream stream : apart ? std::vector{Stream::video, Stream::audio} : std::vector{Stream::any})
        for (int failures = 0; failures < 2;)
            if (const auto frame = file.next_frame(stream); !frame)
                ++failures;
            else if (frame->config_changed())
                (frame->stream == Stream::video ? configs.first : configs.second)
                    .assign(frame->new_config.begin(), frame->new_config.end());
    return configs;
}

// A host call that fails once delays a report at most.
TEST(Interface, ReportsConfigurationsAfterAHostFailure)
{
    for (const bool apart : {false, true})
        FailEachCall(ConfigFile("Aa12CB1cb2121212").bytes, [apart](const flvdmx::Host& host) {
            auto file = flvdmx::File::open(FakeHost::DEFAULT_FILE, host, {1024, 0, apart});
            if (!file->info().video || !file->info().audio)
                return; // the open met the failure
            EXPECT_EQ(LastConfigs(*file, apart), std::pair(ConfigOf('B'), ConfigOf('b'))) << apart;
        });
}

// A list that could not be read is a failure, not an empty list; playing goes on where it was.
TEST(Interface, ReportsListsThatCannotBeRead)
{
    const Expected sample = ReadExpected("avc_aac");
    for (const auto& [function, code] : {std::pair(HostFn::Seek, FLVD_ERR_SEEK), {HostFn::Tell, FLVD_ERR_POSITION}}) {
        FakeHost host(sample.bytes);
        auto file = flvdmx::File::open(FakeHost::DEFAULT_FILE, flvdmx::Host(host.init()));
        EXPECT_TRUE(file->next_frame());
        host.fail_from(function, 1);
        EXPECT_EQ(file->metadata().error().code(), code);
        EXPECT_EQ(file->keyframes().error().code(), code);
        host.fail_nothing();
        EXPECT_EQ(Line(*file->next_frame()), ExpectedLines(sample)[1]);
    }
}

TEST(Interface, KeepsItsPlaceWhenAReportThrows)
{
    auto file = flvdmx::File::open(g_data + "avc_aac.flv");
    EXPECT_THROW((void)file->keyframes([](int64_t, int64_t) -> bool { throw 1; }), int);
    EXPECT_EQ(Line(*file->next_frame()), ExpectedLines(ReadExpected("avc_aac"))[0]);
}

TEST(Interface, ListsWhatAGrowingFileHolds)
{
    Flv growing = ConfigFile("A1112");
    for (const Tag& tag : growing.tags)
        growing.bytes[static_cast<size_t>(tag.end()) - 1] ^= 1; // no size after a tag is right
    Memory memory("growing", growing.bytes);
    auto open = flvdmx::File::open("growing", g_memory, {0, 0, false, true});
    EXPECT_EQ((*open->keyframes()).size(), 3u);
    for (memory.size -= 40; memory.size != growing.bytes.size(); ++memory.size)
        EXPECT_TRUE(open->metadata()) << memory.size; // wherever it ends
}

// A recording that began anew: most of its frames are later than the last ones.
TEST(Interface, DeliversAllFramesOfRestartingTimestamps)
{
    const Flv flv = File({g_meta, Pcm(0), Pcm(500), Pcm(1000), Pcm(1500), Pcm(20), Pcm(100)});
    const Memory memory("memory", flv.bytes);
    for (const bool restarting : {false, true}) {
        flvdmx::Options options;
        options.restarting_timestamps = restarting;
        auto file = flvdmx::File::open("memory", g_memory, options);
        EXPECT_EQ(file->info().seek_method, restarting ? flvdmx::SeekMethod::none : flvdmx::SeekMethod::by_scan);
        std::vector<int64_t> times;
        for (const flvdmx::Frame& frame : file->frames())
            times.push_back(frame.time.count());
        EXPECT_EQ(times, restarting ? std::vector<int64_t>({0, 500, 1000, 1500, 20, 100})
                                    : std::vector<int64_t>({0, 20, 100}));
        EXPECT_EQ(file->seek(50ms).error().code(), restarting ? FLVD_ERR_NOT_SEEKABLE : FLVD_ERR_NONE);
    }
}

// By the index as it is, in the file and in memory; without one by a walk, which damage does not end and the caller
// can.
TEST(Interface, ListsKeyframes)
{
    ChainOptions chain;
    chain.index = true;
    chain.first_ts = 1000;
    chain.hook = [](auto& times, auto&) { times[1] += 0.0035; };
    const Flv indexed = MakeChain(chain);
    const Memory memory("indexed", indexed.bytes);
    Keyframes wanted;
    for (const Tag& tag : indexed.tags)
        if (tag.is_keyframe())
            wanted.emplace_back(tag.timestamp - 1000, tag.offset);
    Keyframes in_index = wanted;
    in_index[1].first += 3;
    for (const bool in_memory : {false, true}) {
        flvdmx::Options options;
        options.index_in_memory = in_memory;
        EXPECT_EQ(List((*flvdmx::File::open("indexed", g_memory, options)).keyframes()), in_index);
    }
    Flv plain = MakeChain({.pictures = 40, .first_ts = 1000});
    wanted.clear();
    for (const Tag& tag : plain.tags)
        if (tag.is_keyframe())
            wanted.emplace_back(tag.timestamp - 1000, tag.offset);
    std::fill_n(&plain.bytes[static_cast<size_t>(wanted[2].second)], 100, uint8_t{0});
    wanted.erase(wanted.begin() + 2);
    const Memory other("plain", plain.bytes);
    auto file = flvdmx::File::open("plain", g_memory);
    std::vector<int64_t> reached;
    const auto stop_after = [&](size_t n) {
        return [&reached, &plain, n](int64_t position, int64_t size) {
            reached.push_back(position);
            return size == plain.size() && reached.size() < n;
        };
    };
    EXPECT_EQ(List(file->keyframes(stop_after(100))), wanted);
    EXPECT_EQ(reached.size(), wanted.size());
    reached.clear();
    EXPECT_EQ(List(file->keyframes(stop_after(2))), Keyframes(wanted.begin(), wanted.begin() + 2));
}

std::string Text(const flvdmx::Property& property)
{
    std::ostringstream text;
    text << property.name << '=';
    if (const auto* const date = std::get_if<flvdmx::Date>(&property.value))
        text << date->milliseconds << "ms" << std::showpos << date->zone_minutes;
    else if (const auto* const string = std::get_if<std::string>(&property.value))
        text << '\'' << *string << '\'';
    else if (const auto* const flag = std::get_if<bool>(&property.value))
        text << (*flag ? "true" : "false");
    else
        text << std::get<double>(property.value);
    return text.str() + ' ';
}

// Script data in the words of Amf(), and what is read of it.
TEST(Interface, ReadsMetadata)
{
    const std::string date = "%11.66.117.211.239.121.128.0.0.0.60", flag = "%1.1", deep = "a: { a: { a: { a: { ";
    struct Case {
        const char* name;
        std::string script, text;
    };
    const Case cases[] = {
        {"kinds", "'onMetaData < title: 'A width: 320 long: \"B on: " + flag + " at: " + date + " none: %5 last: 1 >",
         "title='A' width=320 long='B' on=true at=1.5e+12ms+60 last=1 "},
        {"nested", "'onMetaData { a: { b: [2 'x { c: 3 } } d: 4 }", "a.b.0='x' a.b.1.c=3 d=4 "},
        {"index_is_left_out", "'onMetaData < keyframes: { times: [2 1 2 filepositions: [2 3 4 } a.keyframes: 5 >",
         "a.keyframes=5 "},
        {"other_event", "'onCuePoint { name: 'x time: 2 } 'onMetaData { a: 1 } 7",
         "onCuePoint.name='x' onCuePoint.time=2 a=1 =7 "},
        {"cut_short", "'onMetaData < a: 1 b: %0.1.2", "a=1 "},
        {"unknown_kind", "'onMetaData < a: 1 b: %4 c: 2 >", "a=1 "},
        {"too_long", "'onMetaData < a: 1 b: %2.255.255.65 >", "a=1 "},
        {"wrong_count", "'onMetaData < a: [3 1 2", "a.0=1 a.1=2 "},
        {"sixteen_levels", "'x { " + deep + deep + deep + "a: { a: { a: { b: 1 } } } }",
         "x.a.a.a.a.a.a.a.a.a.a.a.a.a.a.a.b=1 "},
        {"seventeen_levels", "'x { c: 2 " + deep + deep + deep + "a: { a: { a: { a: { b: 1 } } } } }", "x.c=2 "}};
    for (const Case& test : cases) {
        SCOPED_TRACE(test.name);
        const Flv flv = File({Tag{18, 0, Amf(test.script)}, Pcm(0), Tag{18, 0, Amf("'second 1")}, Pcm(20)});
        const Memory memory("memory", flv.bytes);
        std::string text;
        const auto metadata = (*flvdmx::File::open("memory", g_memory)).metadata();
        for (const flvdmx::Property& property : *metadata)
            text += Text(property);
        EXPECT_EQ(text, test.text + "second=1 ");
    }
}

// Names that repeat in every property, properties without end.
TEST(Interface, BoundsMetadata)
{
    const std::string name(60000, 'n');
    Bytes script = Amf("'onMetaData");
    for (int depth = 0; depth < 10; ++depth)
        Append(script, Concat({{3}, BigEndian(name.size(), 2), {name.begin(), name.end()}}));
    script.push_back(10);
    Append(script, Concat({BigEndian(0xFFFFFFFF, 4), Bytes(400000, 5), Amf("1 2 3")}));
    flvdmx::Metadata metadata;
    metadata.add_script_data({script.data(), script.size()});
    EXPECT_EQ(metadata.size(), 1u) << "600 KB of names, of which 1 MiB is kept";
    Bytes many = Amf("[5000");
    many.insert(many.end(), 45000, 0);
    flvdmx::Metadata numbers;
    numbers.add_script_data({many.data(), many.size()});
    EXPECT_EQ(numbers.size(), flvdmx::Metadata::max_properties);
    Bytes nothing = Amf("[2000000");
    nothing.insert(nothing.end(), 1999999, 5);
    Append(nothing, Amf("1"));
    flvdmx::Metadata values;
    values.add_script_data({nothing.data(), nothing.size()});
    EXPECT_EQ(values.size(), 0u);
}

// A second host while files of the first are open, and what lets no host do.
TEST(Interface, KeepsToOneHostAtATime)
{
    const std::string path = g_data + "avc_aac.flv";
    const flvdmx::Host posix = flvdmx::make_host(flvd_posix_host_fill);
    auto file = flvdmx::File::open(path);
    auto second = flvdmx::File::open(path);
    const auto refused = flvdmx::File::open(path, posix);
    EXPECT_STREQ(refused.error().name(), "FLVD_ERR_HOST_IN_USE");
    EXPECT_EQ(refused.error().kind(), Kind::failed);
    EXPECT_TRUE(second && file->next_frame());
    *file = flvdmx::File();
    EXPECT_FALSE(flvdmx::File::open(path, posix));
    EXPECT_TRUE(second->next_frame());
    second->close();
    EXPECT_TRUE(flvdmx::File::open(path, posix));
    EXPECT_TRUE(flvdmx::File::open(path)) << "that one was closed at once";
    flvd_init_t functions = posix.functions();
    functions.file_eof = nullptr;
    for (const flvdmx::Host& host : {flvdmx::Host(functions), flvdmx::make_host(nullptr)})
        EXPECT_STREQ(flvdmx::File::open(path, host).error().name(), "FLVD_ERR_HOST_INCOMPLETE");
}

TEST(Interface, TellsWhyAFileDidNotOpen)
{
    for (const auto& [fill, is_file] : {std::pair(&flvd_stdio_host_fill, true),
                                        {flvd_posix_host_fill, true},
                                        {flvd_memory_host_fill, false},
                                        {flvd_callback_host_fill, false}}) {
        const flvdmx::Host host = flvdmx::make_host(fill);
        EXPECT_EQ(flvdmx::File::open(g_data + "absent", host).error().system_error(), ENOENT);
        EXPECT_EQ(flvdmx::File::open(g_data, host).error().system_error(), is_file ? EISDIR : ENOENT);
    }
    const auto cut = flvdmx::File::open(g_data + "avc_aac.flv" + '\0' + ".old");
    EXPECT_EQ(cut.error().system_error(), EINVAL);
    const char* const no_callbacks = nullptr;
    EXPECT_EQ(flvdmx::File::open(no_callbacks).error().system_error(), ENOENT);
    const auto text = flvdmx::File::open(g_data + "script_data.txt");
    EXPECT_EQ(text.error().code(), FLVD_ERR_FILE_HEADER);
    EXPECT_EQ(text.error().system_error(), 0) << "it was opened";
}

// What a program may get wrong, and what it gets.
TEST(Interface, SurvivesMisuse)
{
    flvdmx::result<flvdmx::File> absent = flvdmx::File::open("absent");
    flvdmx::File closed, moved_to(std::move(closed));
    auto opened = flvdmx::File::open(g_data + "avc_aac.flv");
    const flvdmx::Frame frame = *opened->next_frame();
    EXPECT_EQ(frame.data[frame.data.size()], 0);
    for (const flvdmx::Frame& each : opened->frames()) {
        opened->close();
        EXPECT_EQ(each.stream, Stream::video);
    }
    for (flvdmx::File* const file : {&*absent, &closed, &moved_to, &*opened}) {
        EXPECT_FALSE(file->is_open());
        for (const auto& error :
             {file->next_frame().error(), file->seek(0ms).error(), file->metadata().error(), file->keyframes().error(),
              file->follow([] { return true; }).error(), file->last_error()})
            EXPECT_STREQ(error.name(), "FLVD_ERR_NO_INSTANCE");
        EXPECT_TRUE((*file->next_frame()).data.empty());
        EXPECT_EQ(*file->seek(1s), 0ms);
        EXPECT_FALSE(file->info().video || file->info().audio);
        flvdmx::FrameRange range = file->frames();
        EXPECT_TRUE((*range.begin()).data.empty());
        file->close();
    }
    flvdmx::Options options;
    options.separate_audio_reader = true;
    auto apart = flvdmx::File::open(g_data + "avc_aac.flv", options);
    for (const Stream stream : {Stream::any, static_cast<Stream>(7)})
        EXPECT_STREQ(apart->next_frame(stream).error().name(), "FLVD_ERR_BAD_STREAM");
    EXPECT_EQ((*apart->next_frame(Stream::video)).position, 495) << "nothing was lost";

    auto walked = flvdmx::File::open(g_data + "avc_aac.flv");
    const auto whole = walked->keyframes([&](int64_t, int64_t) { // which must not use the file that is walked over
        EXPECT_FALSE(walked->next_frame() || walked->seek(0ms) || walked->metadata() || walked->keyframes());
        flvdmx::File other(std::move(*walked));
        other.close();
        *walked = flvdmx::File();
        return true;
    });
    EXPECT_TRUE(walked->is_open());
    int64_t last = 0;
    for (const flvdmx::Keyframe& key : *walked->keyframes()) // a list that nothing else holds
        last = key.position;
    EXPECT_EQ(last, whole->back().position);
}

// All that a program does with a file. Of each frame that comes the tag must be the one that carries it.
void UseAll(flvdmx::result<flvdmx::File> file, const Lines& whole)
{
    const auto play = [&](int frames) {
        for (auto frame = file->next_frame(); frame && --frames >= 0; frame = file->next_frame())
            EXPECT_TRUE(frame->position < 0 || std::count(whole.begin(), whole.end(), Line(*frame)) != 0)
                << Line(*frame);
    };
    play(3);
    (void)file->metadata();
    (void)file->keyframes();
    play(3);
    (void)file->seek(300ms, SeekMode::backward);
    play(1000);
    file->close();
    EXPECT_FALSE(file->next_frame());
}

// Each function of the host fails once, at each of its calls.
TEST(Interface, SurvivesEveryHostFailure)
{
    const Expected sample = ReadExpected("avc_bframes_aac");
    const Lines whole = ExpectedLines(sample);
    for (const bool growing : {false, true})
        FailEachCall(sample.bytes, [&, growing](const flvdmx::Host& host) {
            UseAll(flvdmx::File::open(FakeHost::DEFAULT_FILE, host, {0, 0, false, growing}), whole);
        });
}

// The same for the two callbacks of a file; a name that is gone is not opened.
TEST(Interface, SurvivesEveryCallbackFailure)
{
    struct Source {
        const Bytes& bytes;
        int calls = 0, failing = 0;
        bool fails() { return ++calls == failing; }
    };
    const Expected sample = ReadExpected("avc_bframes_aac");
    const Lines whole = ExpectedLines(sample);
    const flvdmx::Host host = flvdmx::make_host(flvd_callback_host_fill);
    Sweep sweep;
    int calls = 1;
    for (int n = 0; n <= calls; ++n) {
        if (!sweep.takes_next())
            continue;
        SCOPED_TRACE(n);
        Source source{sample.bytes, 0, n};
        flvd_callback_file_t file{};
        file.read_at = [](void* user, int64_t position, void* buffer, uint32_t size) {
            auto& from = *static_cast<Source*>(user);
            const auto end = static_cast<int64_t>(from.bytes.size());
            const auto left = from.fails() ? 0 : std::max<int64_t>(end - position, 0);
            const auto count = std::min<int64_t>({left, size, 1000}); // short reads are no end
            std::copy_n(from.bytes.data() + (left != 0 ? position : 0), count, static_cast<uint8_t*>(buffer));
            return static_cast<uint32_t>(count);
        };
        file.get_size = [](void* user) {
            auto& from = *static_cast<Source*>(user);
            return from.fails() ? -1 : static_cast<int64_t>(from.bytes.size());
        };
        file.user = &source;
        const std::string path = flvd_callback_host_add(&file);
        auto opened = flvdmx::File::open(path, host);
        flvd_callback_host_remove(&file);
        EXPECT_EQ(flvdmx::File::open(path, host).error().system_error(), ENOENT);
        EXPECT_TRUE(n != 0 || opened);
        UseAll(std::move(opened), whole);
        calls = n == 0 ? source.calls : calls;
    }
    flvd_callback_file_t incomplete{};
    EXPECT_EQ(flvd_callback_host_add(&incomplete), nullptr);
}

// Keyframes every 0.4 s: the index counts from 0, the tags from 23 ms.
TEST(Interface, SeeksAsNamed)
{
    // Where from, time, mode, the time reached or -1 for a miss.
    const std::tuple<std::chrono::milliseconds, std::chrono::milliseconds, SeekMode, int64_t> cases[] = {
        {0ms, 1000ms, SeekMode::automatic, 1223},
        {2000ms, 1000ms, SeekMode::absolute, 823},
        {0ms, 1000ms, SeekMode::backward, 823},
        {2400ms, -500ms, SeekMode::relative, 1623},
        {2400ms, -500ms, SeekMode::relative | SeekMode::forward, 2023},
        {0ms, 2900ms, SeekMode::forward, -1},
        {0ms, 2900ms, SeekMode::forward | SeekMode::retry_backward, 2823},
        {0ms, std::chrono::hours(10000), SeekMode::to_end_on_miss, -1}};
    for (const auto& [from, time, mode, wanted] : cases) {
        SCOPED_TRACE(testing::Message() << time.count() << " mode " << static_cast<uint32_t>(mode));
        auto file = flvdmx::File::open(g_data + "avc_aac_index.flv");
        ASSERT_TRUE(file->seek(from, SeekMode::forward));
        const auto reached = file->seek(time, mode);
        EXPECT_EQ(reached ? reached->count() : -1, wanted);
        EXPECT_EQ(reached.error().kind(), wanted < 0 ? Kind::miss : Kind::none);
        const auto next = file->next_frame();
        EXPECT_EQ(next.error().kind(), mode == SeekMode::to_end_on_miss ? Kind::end : Kind::none);
        EXPECT_TRUE(wanted < 0 || next->time.count() == wanted);
    }
}

TEST(Interface, SeeksToTheFirstTagForTimeZero)
{
    const Flv flv =
        File({g_avc, g_aac, Raw(1000), Raw(1020), Tag{9, 1040, AvcNalu(false, Noise(60))}, Nalu(1200), Nalu(1300)});
    const Memory memory("memory", flv.bytes);
    for (const auto time : {0ms, -500ms})
        for (const SeekMode mode : {SeekMode::automatic, SeekMode::forward, SeekMode::backward}) {
            auto file = flvdmx::File::open("memory", g_memory);
            EXPECT_EQ((*file->seek(time, mode)).count(), 0);
            EXPECT_EQ((*file->next_frame()).position, flv.tags[2].offset);
        }
}

// A file that arrives 100 bytes at a time, played beside another one: no frame is lost or doubled.
TEST(Interface, FollowsAGrowingFile)
{
    const Expected sample = ReadExpected("avc_aac"), another = ReadExpected("mp3_only");
    Memory growing("growing", sample.bytes), other("other", another.bytes);
    const flvdmx::Options options = {8192, 0, false, true};
    for (growing.size = 0; growing.size <= 258; ++growing.size) { // there begins the first media tag
        EXPECT_EQ(flvdmx::File::open("growing", g_memory, options).error().kind(), Kind::not_yet) << growing.size;
        EXPECT_EQ(flvdmx::File::open("growing", g_memory, {}).error().kind(), Kind::failed) << growing.size;
    }
    growing.size = 2500;
    const std::lock_guard lock(flvdmx::open_mutex); // opens and closes all the same
    auto file = flvdmx::File::open("growing", g_memory, options);
    auto second = flvdmx::File::open("other", g_memory);
    ASSERT_TRUE(file && second);
    const auto wait = [&] {
        growing.size = std::min<uint64_t>(growing.size + 100, sample.bytes.size());
        return growing.size < sample.bytes.size();
    };
    Lines frames, others;
    for (auto frame = file->follow(wait); frame; frame = file->follow(wait)) {
        frames.push_back(Line(*frame));
        if (const auto beside = second->next_frame())
            others.push_back(Line(*beside));
    }
    EXPECT_EQ(frames, ExpectedLines(sample));
    EXPECT_EQ(others, ExpectedLines(another));
    EXPECT_EQ(file->last_error().kind(), Kind::not_yet);
}

// More tags without a frame than one request passes. With two readers video is at its end before audio begins.
TEST(Interface, CrossesTagsWithoutAFrame)
{
    std::vector<Tag> tags = {g_avc, g_aac, Nalu(0), Raw(10)};
    for (int i = 0; i < 300; ++i)
        tags.push_back(i % 2 == 0 ? g_avc : g_aac);
    tags.insert(tags.end(), {Nalu(40), Raw(50)});
    const Bytes bytes = File(tags).bytes;
    const Memory memory("memory", bytes);
    for (const auto& [apart, growing] : {std::pair(false, false), {false, true}, {true, false}, {true, true}}) {
        SCOPED_TRACE(testing::Message() << (apart ? "two readers" : "one reader") << (growing ? ", growing" : ""));
        const flvdmx::Options options = {0, 0, apart, growing};
        auto file = flvdmx::File::open("memory", g_memory, options);
        std::vector<int64_t> times;
        for (const Stream stream : apart ? std::vector{Stream::video, Stream::audio} : std::vector{Stream::any})
            for (const flvdmx::Frame& frame : file->frames(stream))
                times.push_back(frame.time.count());
        EXPECT_EQ(times, (apart ? std::vector<int64_t>{0, 40, 10, 50} : std::vector<int64_t>{0, 10, 40, 50}));
        EXPECT_EQ(file->last_error().kind(), growing ? Kind::not_yet : Kind::end);
    }
}

} // namespace
