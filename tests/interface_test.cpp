// The C++ interface: what it adds to the C interface, on samples with known contents and on files in memory.

#include "flvdmx/flvdmx.hpp"
#include "flvdmx/memory_host.h"
#include "flvdmx/posix_host.h"
#include "support/expected.h"
#include "support/report.h"
#include "support/session.h"
#include "support/sweep.h"

#include <algorithm>
#include <cerrno>
#include <iomanip>
#include <sstream>

using namespace flvd_test;
using namespace std::chrono_literals;
using flvdmx::Kind, flvdmx::SeekMode, flvdmx::Stream;

namespace {

const std::string g_data = FLVDMX_TEST_DATA "/";
const flvdmx::Host g_memory = flvdmx::make_host(flvd_memory_host_fill);

// A file in memory. If there are several, only the newest can be opened.
struct Memory : flvd_memory_file_t {
    explicit Memory(Bytes contents)
        : flvd_memory_file_t{"memory", nullptr, contents.size(), nullptr}, bytes(std::move(contents))
    {
        data = bytes.data();
        flvd_memory_host_add(this);
    }
    ~Memory() { flvd_memory_host_remove(this); }
    flvdmx::result<flvdmx::File> open(const flvdmx::Options& options = {}) const
    {
        return flvdmx::File::open(name, g_memory, options);
    }

    const Bytes bytes;
};

// The streams to request, one after the other.
const auto Streams = [](bool apart) {
    return apart ? std::vector{Stream::video, Stream::audio} : std::vector{Stream::any};
};

// Describes a frame in one line. Times in ms: decoding, presentation.
std::string Line(Stream stream, int64_t time, int64_t presentation, bool keyframe, int64_t position, const Bytes& data)
{
    std::ostringstream line;
    line << (stream == Stream::video ? "video " : "audio ") << time << ' ' << presentation << (keyframe ? " key" : "")
         << " @" << position << ' ' << data.size() << " bytes " << Crc32(data);
    return line.str();
}

std::string Line(const flvdmx::Frame& frame)
{
    return Line(frame.stream, frame.time.count(), frame.presentation_time().count(), frame.keyframe, frame.position,
                Bytes(frame.data.begin(), frame.data.end()));
}

std::string Line(const Tag& tag, int64_t time, int64_t presentation, bool keyframe)
{
    return Line(static_cast<Stream>(tag.stream()), time, presentation, keyframe, tag.offset, tag.frame());
}

using Lines = std::vector<std::string>;

// What the prober found in the requested streams of a sample that starts at 0 ms.
Lines ExpectedLines(const Expected& sample, Stream requested = Stream::any)
{
    Lines lines;
    for (size_t i = 0; i < sample.tags.size(); ++i)
        if (const Tag& tag = sample.tags[i];
            requested == Stream::any || static_cast<uint32_t>(requested) == tag.stream())
            lines.push_back(Line(tag, tag.timestamp, sample.packets[i].presentation, sample.packets[i].keyframe));
    return lines;
}

std::vector<int64_t> Times(flvdmx::FrameRange frames)
{
    std::vector<int64_t> times;
    for (const flvdmx::Frame& frame : frames)
        times.push_back(frame.time.count());
    return times;
}

// Times in ms, positions.
using Keyframes = std::vector<std::pair<int64_t, int64_t>>;

Keyframes List(const flvdmx::result<std::vector<flvdmx::Keyframe>>& list)
{
    Keyframes keyframes;
    for (const flvdmx::Keyframe& keyframe : *list)
        keyframes.emplace_back(keyframe.time.count(), keyframe.position);
    return keyframes;
}

Keyframes ExpectedKeyframes(const Tags& tags, uint32_t first_ts = 0)
{
    Keyframes keyframes;
    for (const Tag& tag : tags)
        if (tag.is_keyframe())
            keyframes.emplace_back(tag.timestamp - first_ts, tag.offset);
    return keyframes;
}

// A range-for over the frames of a temporary file does not compile.
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
    const uint32_t rate = stream.codec == "speex" ? 11025 : stream.sample_rate; // Speex has no rate in the file
    EXPECT_EQ(video ? info.video->width : info.audio->sample_rate, video ? stream.width : rate);
}

class Sample : public testing::TestWithParam<std::string> {};
// Compares all frames and the description of the file with what another demuxer found: with one reader, and with two
// and the caller's buffer; complete and growing. Reading lists halfway through does not change the frames.
TEST_P(Sample, IsDescribedAndPlayed)
{
    const Expected expected = ReadExpected(GetParam());
    const Keyframes keyframes = ExpectedKeyframes(expected.tags);
    Bytes buffer(1u << 16);
    const flvdmx::Options apart = {.scan_read_size = 2000,
                                   .separate_audio_reader = true,
                                   .index_in_memory = true,
                                   .buffer = buffer.data(),
                                   .buffer_size = 1u << 16};
    for (const bool growing : {false, true})
        for (const Stream requested : {Stream::any, Stream::video, Stream::audio}) {
            if (growing && GetParam() == "damaged")
                continue; // damage looks like data that has not been written yet
            SCOPED_TRACE(testing::Message() << static_cast<uint32_t>(requested) << (growing ? " growing" : ""));
            flvdmx::Options options = requested == Stream::any ? flvdmx::Options() : apart;
            options.growing = growing;
            auto file = flvdmx::File::open(g_data + GetParam() + ".flv", options);
            ASSERT_TRUE(file) << file.error().text();
            const flvdmx::Info info = file->info();
            EXPECT_EQ(info.size, growing ? 0 : expected.size());
            EXPECT_EQ(info.start_time, 0ms);
            for (const ExpectedStream& stream : expected.streams)
                ExpectDescribed(info, stream);
            flvdmx::File moved(std::move(*file));
            const Lines wanted = ExpectedLines(expected, requested);
            Lines lines;
            for (auto frame = moved.next_frame(requested); frame; frame = moved.next_frame(requested)) {
                lines.push_back(Line(*frame));
                if (lines.size() != wanted.size() / 2)
                    continue;
                const Keyframes list = List(moved.keyframes());
                const bool by_index = info.seek_method == flvdmx::SeekMethod::by_index; // its times differ
                EXPECT_EQ(list.size(), keyframes.size());
                EXPECT_TRUE(by_index || list == keyframes);
                const auto metadata = moved.metadata();
                EXPECT_NE(metadata->find(info.video ? "width" : "audiocodecid"), nullptr);
            }
            EXPECT_EQ(lines, wanted);
            EXPECT_EQ(moved.last_error().kind(), wanted.empty() ? Kind::failed : growing ? Kind::not_yet : Kind::end);
        }
}
INSTANTIATE_TEST_SUITE_P(Interface, Sample, testing::ValuesIn(g_samples));

// Tests frames and tag headers with values that the samples lack: negative offsets, frame types, extended timestamps, a
// first timestamp other than 0, script data and damage between frames; sizes below and above the cache.
TEST(Interface, DescribesEachFrame)
{
    const auto picture = [](uint32_t ts, int32_t offset, size_t size) {
        return Tag{9, ts, AvcNalu(false, Noise(size), offset)};
    };
    const Tag bad = {8, 0x1000020, AacRaw(Noise(60)), 0};
    const Flv flv = File({g_meta, g_avc, g_aac, Nalu(0x1000000), picture(0x1000008, -8, 60), Raw(0x1000010), g_meta,
                          bad, picture(0x1000028, 0x7FFFFF, 5000), picture(0x1000030, -0x800000, 70000),
                          Raw(0x1000040, 0), Tag{9, 0x1000048, g_avc_end}, Nalu(0x1000050)});
    const struct {
        size_t tag;
        int64_t time, offset;
        bool keyframe;
    } wanted[] = {{3, 0, 0, true},           {4, 8, -8, false}, {5, 16, 0, true}, {8, 40, 0x7FFFFF, false},
                  {9, 48, -0x800000, false}, {10, 64, 0, true}, {12, 80, 0, true}};
    const Memory memory(flv.bytes);
    std::vector<Tag> valid = flv.tags;
    valid.erase(valid.begin() + 7); // bad
    size_t seen = 0;
    EXPECT_EQ((*memory.open())
                  .for_each_tag([&](const flvdmx::Tag& read) {
                      const Tag& tag = valid.at(seen++);
                      EXPECT_EQ(std::tuple(read.position, read.end(), read.timestamp(), read.type(), read.has_frame()),
                                std::tuple(tag.offset, tag.end(), tag.timestamp, tag.type, tag.is_frame()));
                      EXPECT_EQ(read.frame_size(), tag.is_frame() ? tag.frame().size() : 0);
                      EXPECT_EQ(read.is_video() && read.has_frame() && read.is_keyframe(), tag.is_keyframe());
                      return seen < valid.size();
                  })
                  .kind(),
              Kind::none);
    EXPECT_EQ(seen, valid.size());
    for (const bool apart : {false, true}) {
        auto file = memory.open({.separate_audio_reader = apart});
        EXPECT_EQ(file->info().start_time.count(), 0x1000000);
        for (const auto& [index, time, offset, keyframe] : wanted) {
            const Tag& tag = flv.tags[index];
            const auto got = file->next_frame(static_cast<Stream>(tag.stream()));
            EXPECT_EQ(Line(*got), Line(tag, time, time + offset, keyframe));
        }
    }
}

// Configurations named by letters: upper case for AVC, lower case for AAC. L does not fit the cache, X is too long.
Bytes ConfigOf(char letter)
{
    Bytes config = letter < 'a' ? SmallAvcRecord() : Bytes{0x12, 0x10};
    config.push_back(static_cast<uint8_t>(letter));
    config.resize(letter == 'X' ? 65537 : letter == 'L' ? 5000 : config.size());
    return config;
}

// The letter of a configuration; a dot for none.
char LetterOf(const flvdmx::Bytes& config)
{
    for (const char letter : std::string("ABCLXabc"))
        if (ConfigOf(letter) == Bytes(config.begin(), config.end()))
            return letter;
    return '.';
}

// A file of configurations, video frames (1), audio frames (2) and holes of zeros (#), one every 10 ms.
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

// Plays a file; returns the letter of the configuration that each tag's frame reports.
std::string ReportedConfigs(flvdmx::File& file, const Flv& flv, const std::string& letters, bool apart,
                            const std::function<bool()>& wait)
{
    std::string reported(letters.size(), '.');
    for (const Stream stream : Streams(apart))
        for (auto frame = file.follow(wait, stream); frame; frame = file.follow(wait, stream))
            for (size_t i = 0; i < letters.size() && frame->config_changed(); ++i)
                if (flv.tags[i].offset == frame->position)
                    reported[i] = LetterOf(frame->new_config);
    return reported;
}

// Below each file: what is reported when it is played, and when it is played again from the start.
TEST(Interface, ReportsChangedConfigurations)
{
    const struct {
        const char *name, *file, *first, *again;
    } cases[] = {
        {.name = "a copy of the current configuration is not a change",
         .file = "Aa12Aa12B212bB12AC12",
         .first = "..........B....b..C.",
         .again = "..Aa......B....b..C."},
        {.name = "no frame needs the one in between", .file = "A1BA1B1", .first = "......B", .again = ".A....B"},
        {.name = "larger than the cache", .file = "A1L11B1", .first = "...L..B", .again = ".A.L..B"},
        {.name = "above 64 KiB", .file = "A11X1B1", .first = "......B", .again = ".A....B"},
        {.name = "after holes longer than a search", .file = "A121#B#12", .first = ".......B.", .again = ".A.....B."}};
    for (const auto& test : cases) {
        const Flv flv = ConfigFile(test.file);
        Memory memory(flv.bytes);
        for (const auto& [apart, growing] : {std::pair(false, false), {false, true}, {true, false}, {true, true}}) {
            SCOPED_TRACE(testing::Message()
                         << test.name << (apart ? ", two readers" : "") << (growing ? ", growing" : ""));
            memory.size = growing ? static_cast<uint64_t>(flv.tags[3].end()) : flv.bytes.size();
            auto file = memory.open({.cache_size = 1024, .separate_audio_reader = apart, .growing = growing});
            const auto grow = [&] {
                EXPECT_FALSE(file->seek(1s)) << "changes nothing";
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

// A frame that directly follows another one is written into the caller's memory. A small damaged tag does not cause the
// large frame after it to be skipped. Only damage, not other tags, counts as a break between whole tags.
TEST(Interface, DeliversIntoTheCallersMemory)
{
    const Tag bad = {9, 80, AvcNalu(true, Noise(50)), 0};
    const Flv flv =
        File({g_avc, g_aac, Nalu(0), Raw(10), Nalu(40, 70000), bad, Nalu(120, 9000), Raw(130),
              Tag{9, 140, AvcConfig(ConfigOf('B'))}, Tag{18, 140, OnMetaData("width: 320")}, Nalu(160), Raw(170)});
    const Memory memory(flv.bytes);
    Bytes spare(100'000), own;
    auto plain = memory.open();
    auto file = memory.open({.buffer = spare.data(), .buffer_size = 100'000});
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

// Seeks, or not, and plays up to a time; returns the letter of the last configuration reported.
char LastReport(flvdmx::File& file, int64_t from, int64_t to, Stream stream)
{
    EXPECT_TRUE(from < 0 || file.seek(std::chrono::milliseconds(from), SeekMode::backward));
    char reported = '.';
    for (int64_t time = -1; time < to;) {
        const auto frame = file.next_frame(stream);
        time = frame ? frame->time.count() : to;
        reported = frame->config_changed() ? LetterOf(frame->new_config) : reported;
    }
    return reported;
}

TEST(Interface, RemembersConfigurationsThatItHasPassed)
{
    const std::string nine(9, '1');
    const Memory back(ConfigFile("A" + nine + "B" + nine + "A" + nine + "A" + nine).bytes);
    auto file = back.open();
    EXPECT_EQ(LastReport(*file, -1, 20, Stream::any), '.');
    EXPECT_EQ(LastReport(*file, 190, 350, Stream::any), '.');
    EXPECT_EQ(LastReport(*file, 90, 120, Stream::any), 'B');
    EXPECT_EQ(LastReport(*file, 250, 260, Stream::any), 'A') << "passed twice";
    const Memory two(ConfigFile("Aa12bB21A12121212121212").bytes);
    auto apart = two.open({.separate_audio_reader = true});
    EXPECT_EQ(LastReport(*apart, -1, 100, Stream::audio), 'b');
    EXPECT_EQ(LastReport(*apart, 150, 160, Stream::video), '.') << "passed by the other reader only";
}

// A stream that starts after the tags that an open examines is missing from the information, but its frames are
// complete. Before its first frame, there are more tags without a frame than one request skips.
TEST(Interface, DescribesFramesOfAStreamThatBeginsLate)
{
    const std::string letters = "a" + std::string(120, '2') + std::string(120, 'A') + "12";
    const Flv flv = ConfigFile(letters);
    const Memory memory(flv.bytes);
    auto file = memory.open();
    EXPECT_FALSE(file->info().video);
    const std::string wanted = std::string(letters.size() - 2, '.') + "A.";
    EXPECT_EQ(ReportedConfigs(*file, flv, letters, false, [] { return false; }), wanted);
}

// A seek back to a change that was forgotten reports nothing, rather than a wrong configuration.
TEST(Interface, ForgetsEarlyConfigurations)
{
    Tags tags;
    const auto config = [](uint32_t n) { return Concat({SmallAvcRecord(), BigEndian(n, 2)}); };
    for (uint32_t n = 0; n < 300; ++n)
        tags.insert(tags.end(), {Tag{9, n * 10, AvcConfig(config(n))}, Nalu(n * 10)});
    const Memory memory(File(tags).bytes);
    auto file = memory.open();
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

// Runs with a host that does not fail, and then once for each call with that call failing.
void FailEachCall(const Bytes& bytes, const std::function<void(const flvdmx::Host& host)>& use)
{
    const auto run = [&](uint64_t failing_call) {
        SCOPED_TRACE(testing::Message() << "call " << failing_call);
        FakeHost host(bytes);
        host.fail_nth_call(failing_call);
        use(flvdmx::Host(host.init()));
        EXPECT_EQ(host.live_blocks(), 0u);
        return host.failable_calls();
    };
    Sweep sweep;
    const uint64_t calls = run(0);
    for (uint64_t n = 1; n <= calls; ++n)
        if (sweep.takes_next())
            run(n);
}

// The last configurations that were reported for video and audio, after up to two failed requests.
std::pair<Bytes, Bytes> LastConfigs(flvdmx::File& file, bool apart)
{
    std::pair configs(file.info().video->config, file.info().audio->config);
    for (const Stream stream : Streams(apart))
        for (int failures = 0; failures < 2;)
            if (const auto frame = file.next_frame(stream); !frame)
                ++failures;
            else if (frame->config_changed())
                (frame->stream == Stream::video ? configs.first : configs.second)
                    .assign(frame->new_config.begin(), frame->new_config.end());
    return configs;
}

// A host call that fails once can delay a report, but not lose it.
TEST(Interface, ReportsConfigurationsAfterAHostFailure)
{
    for (const bool apart : {false, true})
        FailEachCall(ConfigFile("Aa12CB1cb2121212").bytes, [apart](const flvdmx::Host& host) {
            const flvdmx::Options options = {.cache_size = 1024, .separate_audio_reader = apart};
            auto file = flvdmx::File::open(FakeHost::DEFAULT_FILE, host, options);
            if (!file->info().video || !file->info().audio)
                return; // the call of the open failed
            EXPECT_EQ(LastConfigs(*file, apart), std::pair(ConfigOf('B'), ConfigOf('b'))) << apart;
        });
}

// A list that cannot be read is a failure, not an empty list; playing continues where it was.
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
        EXPECT_EQ(file->for_each_tag([](const flvdmx::Tag&) { return true; }).code(), code);
        host.fail_nothing();
        EXPECT_EQ(Line(*file->next_frame()), ExpectedLines(sample)[1]);
    }
}

TEST(Interface, ListsWhatAGrowingFileHolds)
{
    Flv growing = ConfigFile("A1112");
    for (const Tag& tag : growing.tags)
        growing.bytes[static_cast<size_t>(tag.end()) - 1] ^= 1; // all back-pointers are wrong
    Memory memory(growing.bytes);
    auto open = memory.open({.growing = true});
    EXPECT_EQ((*open->keyframes()).size(), 3u);
    for (memory.size -= 40; memory.size != growing.bytes.size(); ++memory.size)
        EXPECT_TRUE(open->metadata()) << memory.size; // at any size
}

// Most frames of a recording whose timestamps restart are later than its last timestamp.
TEST(Interface, DeliversAllFramesOfRestartingTimestamps)
{
    const Memory memory(File({g_meta, Pcm(0), Pcm(500), Pcm(1000), Pcm(1500), Pcm(20), Pcm(100)}).bytes);
    auto plain = memory.open(), file = memory.open({.restarting_timestamps = true});
    EXPECT_EQ(plain->info().seek_method, flvdmx::SeekMethod::by_scan);
    EXPECT_EQ(file->info().seek_method, flvdmx::SeekMethod::none);
    EXPECT_EQ(Times(plain->frames()), std::vector<int64_t>({0, 20, 100}));
    EXPECT_EQ(Times(file->frames()), std::vector<int64_t>({0, 500, 1000, 1500, 20, 100}));
    EXPECT_TRUE(plain->seek(50ms));
    EXPECT_EQ(file->seek(50ms).error().code(), FLVD_ERR_NOT_SEEKABLE);

    auto late = memory.open(); // finds out while it plays
    EXPECT_EQ((*late->next_frame()).time, 0ms);
    late->accept_restart(late->position());
    EXPECT_EQ(Times(late->frames()), std::vector<int64_t>({500, 1000, 1500, 20, 100}));
    EXPECT_EQ(late->seek(50ms).error().code(), FLVD_ERR_NOT_SEEKABLE);
}

TEST(Interface, ScansWhereTheIndexIsWrong)
{
    const Flv chain = MakeChain({.index = true, .hook = [](auto& times, auto&) {
                                     for (auto& time : times)
                                         time += 5;
                                 }});
    const auto [time, position] = ExpectedKeyframes(chain.tags)[2];
    const Memory memory(chain.bytes);
    auto file = memory.open();
    EXPECT_EQ(file->seek(std::chrono::milliseconds(time)).error().kind(), Kind::failed);
    file->ignore_index();
    EXPECT_EQ((*file->seek(std::chrono::milliseconds(time))).count(), time);
    EXPECT_EQ(file->position(), position);
}

// The list comes from the index, in the file or in memory. Without one, it comes from a scan, which continues after
// damage until the caller stops it.
TEST(Interface, ListsKeyframes)
{
    constexpr uint32_t FIRST = 1000;
    const Flv indexed =
        MakeChain({.index = true, .first_ts = FIRST, .hook = [](auto& times, auto&) { times[1] += 0.0035; }});
    Keyframes wanted = ExpectedKeyframes(indexed.tags, FIRST);
    wanted[1].first += 3;
    const Memory memory(indexed.bytes);
    for (const bool in_memory : {false, true})
        EXPECT_EQ(List((*memory.open({.index_in_memory = in_memory})).keyframes()), wanted);

    Flv plain = MakeChain({.pictures = 40, .first_ts = FIRST});
    wanted = ExpectedKeyframes(plain.tags, FIRST);
    std::fill_n(&plain.bytes[static_cast<size_t>(wanted[2].second)], 100, uint8_t{0});
    wanted.erase(wanted.begin() + 2);
    const Memory other(plain.bytes);
    auto file = other.open();
    for (const size_t stop_after : {wanted.size() + 1, size_t{2}}) {
        Keyframes list(wanted.begin(),
                       wanted.begin() + static_cast<std::ptrdiff_t>(std::min(stop_after, wanted.size())));
        std::vector<int64_t> reached;
        EXPECT_EQ(List(file->keyframes([&](int64_t position, int64_t size) {
                      reached.push_back(position);
                      return size == plain.size() && reached.size() < stop_after;
                  })),
                  list);
        EXPECT_EQ(reached.size(), list.size());
        EXPECT_EQ(reached.back(), list.back().second);
    }
}

std::string Text(const flvdmx::Property& property)
{
    std::ostringstream text;
    text << std::boolalpha << property.name << '=';
    const auto print = [&text](const auto& value) {
        if constexpr (std::is_same_v<decltype(value), const flvdmx::Date&>)
            text << value.milliseconds << "ms" << std::showpos << value.zone_minutes;
        else if constexpr (std::is_same_v<decltype(value), const std::string&>)
            text << std::quoted(value, '\'');
        else
            text << value;
    };
    std::visit(print, property.value);
    return text.str() + ' ';
}

TEST(Interface, ReadsTheMetadataOfTheTable)
{
    for (const std::vector<std::string>& row : ReadTable("metadata.txt")) {
        const Memory memory(File({{18, 0, Amf(row[0])}, Pcm(0), {18, 0, Amf("'second 1")}, Pcm(20)}).bytes);
        std::string text;
        for (const flvdmx::Property& property : *(*memory.open()).metadata())
            text += Text(property);
        EXPECT_EQ(text, row.at(1) + " second=1 ") << row[0];
    }
}

// Names that repeat in every property, endless properties, and values that are not kept.
TEST(Interface, LimitsMetadata)
{
    const auto count = [](const Bytes& script) {
        flvdmx::Metadata metadata;
        metadata.add_script_data({script.data(), script.size()});
        return metadata.size();
    };
    const Bytes nested = Concat({{3}, BigEndian(60000, 2), Bytes(60000, 'n')});
    const Bytes names = Concat(std::vector(10, nested));
    EXPECT_EQ(count(Concat({names, {10}, BigEndian(0xFFFFFFFF, 4), Bytes(400000, 5), Amf("1 2 3")})), 1u)
        << "600 KB of names, of which 1 MiB is kept";
    EXPECT_EQ(count(Concat({Amf("[5000"), Bytes(45000, 0)})), flvdmx::Metadata::max_properties);
    EXPECT_EQ(count(Concat({Amf("[2000000"), Bytes(1999999, 5), Amf("1")})), 0u);
}

TEST(Interface, RejectsASecondHostAndAnIncompleteOne)
{
    const std::string path = g_data + "avc_aac.flv";
    const flvdmx::Host posix = flvdmx::make_host(flvd_posix_host_fill);
    auto file = flvdmx::File::open(path);
    auto second = flvdmx::File::open(path);
    const auto refused = flvdmx::File::open(path, posix);
    EXPECT_STREQ(refused.error().name(), "FLVD_ERR_HOST_IN_USE");
    EXPECT_TRUE(second && file->next_frame());
    *file = flvdmx::File();
    EXPECT_FALSE(flvdmx::File::open(path, posix));
    EXPECT_TRUE(second->next_frame());
    second->close();
    EXPECT_TRUE(flvdmx::File::open(path, posix));
    EXPECT_TRUE(flvdmx::File::open(path)) << "the previous file was closed at once";
    flvd_init_t functions = posix.functions();
    functions.file_eof = nullptr;
    for (const flvdmx::Host& host : {flvdmx::Host(functions), flvdmx::make_host(nullptr)})
        EXPECT_STREQ(flvdmx::File::open(path, host).error().name(), "FLVD_ERR_HOST_INCOMPLETE");
}

TEST(Interface, ReportsWhyAFileDidNotOpen)
{
    for (const auto& [path, reason] : {std::pair(g_data + "absent", ENOENT), {g_data, EISDIR}})
        EXPECT_EQ(flvdmx::File::open(path).error().system_error(), reason);
    const auto cut = flvdmx::File::open(g_data + "avc_aac.flv" + '\0' + ".old");
    EXPECT_EQ(cut.error().system_error(), EINVAL);
    const char* const no_callbacks = nullptr;
    EXPECT_EQ(flvdmx::File::open(no_callbacks).error().system_error(), ENOENT);
    EXPECT_STREQ(flvdmx::error(Kind::failed, 1, 0).name(), "unknown");
    const auto text = flvdmx::File::open(g_data + "script_data.txt");
    EXPECT_EQ(text.error().code(), FLVD_ERR_FILE_HEADER);
    EXPECT_EQ(text.error().system_error(), 0) << "it was opened";
}

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
    auto apart = flvdmx::File::open(g_data + "avc_aac.flv", {.separate_audio_reader = true});
    for (const Stream stream : {Stream::any, static_cast<Stream>(7)})
        EXPECT_STREQ(apart->next_frame(stream).error().name(), "FLVD_ERR_BAD_STREAM");
    EXPECT_EQ((*apart->next_frame(Stream::video)).position, 495) << "the rejected requests skipped nothing";

    auto walked = flvdmx::File::open(g_data + "avc_aac.flv");
    (void)walked->keyframes([&](int64_t, int64_t) { // must not use the file that is being scanned
        EXPECT_FALSE(walked->next_frame() || walked->seek(0ms) || walked->metadata() || walked->keyframes());
        flvdmx::File other(std::move(*walked));
        other.close();
        *walked = flvdmx::File();
        return true;
    });
    EXPECT_THROW((void)walked->keyframes([](int64_t, int64_t) -> bool { throw 1; }), int);
    EXPECT_EQ(Line(*walked->next_frame()), ExpectedLines(ReadExpected("avc_aac"))[0]) << "playing continues";
}

// Uses all functions of a file. Each frame delivered must be one of the file's, described as in its tag.
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

TEST(Interface, SurvivesEveryHostFailure)
{
    const Expected sample = ReadExpected("avc_bframes_aac");
    const Lines whole = ExpectedLines(sample);
    for (const bool growing : {false, true})
        FailEachCall(sample.bytes, [&, growing](const flvdmx::Host& host) {
            UseAll(flvdmx::File::open(FakeHost::DEFAULT_FILE, host, {.growing = growing}), whole);
        });
}

// Keyframes every 0.4 s: the index starts at 0, the tags at 23 ms.
TEST(Interface, SeeksInEveryMode)
{
    // From, time, mode, time reached or -1 for a miss.
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
    const Memory memory(flv.bytes);
    for (const auto time : {0ms, -500ms})
        for (const SeekMode mode : {SeekMode::automatic, SeekMode::forward, SeekMode::backward}) {
            auto file = memory.open();
            EXPECT_EQ((*file->seek(time, mode)).count(), 0);
            EXPECT_EQ((*file->next_frame()).position, flv.tags[2].offset);
        }
}

// A file that arrives 100 bytes at a time: no frame is lost or repeated.
TEST(Interface, FollowsAGrowingFile)
{
    const Expected sample = ReadExpected("avc_aac");
    Memory growing(sample.bytes);
    const flvdmx::Options options = {.cache_size = 8192, .growing = true};
    for (growing.size = 0; growing.size <= 258; ++growing.size) { // the first media tag starts there
        EXPECT_EQ(growing.open(options).error().kind(), Kind::not_yet) << growing.size;
        EXPECT_EQ(growing.open().error().kind(), Kind::failed) << growing.size;
    }
    growing.size = 2500;
    const std::lock_guard lock(flvdmx::open_mutex); // its owner can still open and close files
    auto file = growing.open(options);
    const auto wait = [&] {
        growing.size = std::min<uint64_t>(growing.size + 100, sample.bytes.size());
        return growing.size < sample.bytes.size();
    };
    Lines frames;
    for (auto frame = file->follow(wait); frame; frame = file->follow(wait))
        frames.push_back(Line(*frame));
    EXPECT_EQ(frames, ExpectedLines(sample));
    EXPECT_EQ(file->last_error().kind(), Kind::not_yet);
}

} // namespace
