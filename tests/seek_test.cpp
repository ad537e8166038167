// Seeking: where it lands, what is delivered from there on, what it costs, and that a failed seek moves nothing.

#include "support/expected.h"
#include "support/report.h"
#include "support/session.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <random>
#include <set>

using namespace flvd_test;

namespace {

constexpr uint32_t AUTO = 0, BACK = FLVD_SEEK_BACKWARD, FORTH = FLVD_SEEK_FORWARD, REL = FLVD_SEEK_RELATIVE;
constexpr uint32_t AT_END = FLVD_SEEK_TO_END_ON_MISS, RETRY = FLVD_SEEK_RETRY_BACKWARD;
constexpr uint32_t ONE = 0, TWO = FLVD_OPT_SEPARATE_AUDIO_READER, MEMORY = FLVD_OPT_INDEX_IN_MEMORY;
constexpr size_t ALL = 100000, FIRST_TAG = 9; // where a rewind goes: behind the file header
constexpr int32_t UNTOUCHED = -77777;
const std::string TIMES("\0\5times", 7), POSITIONS("\0\15filepositions", 15), KEYFRAMES("\0\11keyframes", 11);

uint64_t Big(const Bytes& bytes, size_t at, size_t size)
{
    uint64_t value = 0;
    for (size_t i = at; i < at + size; ++i)
        value = value << 8 | bytes.at(i);
    return value;
}

uint32_t TagTime(const Bytes& bytes, size_t pos)
{
    return static_cast<uint32_t>(Big(bytes, pos + 4, 3) | Big(bytes, pos + 7, 1) << 24);
}

// Where the elements of a script array begin; behind the end of the file without such a key.
size_t Elements(const Bytes& bytes, const std::string& key)
{
    const auto name = std::search(bytes.begin(), bytes.end(), key.begin(), key.end());
    return static_cast<size_t>(name - bytes.begin()) + key.size() + 5;
}

// Those of them that are numbers, up to the first that is none.
std::vector<double> Numbers(const Bytes& bytes, const std::string& key)
{
    std::vector<double> out;
    const size_t begin = Elements(bytes, key);
    for (size_t at = begin; at + 9 <= bytes.size() && at < begin + 9 * Big(bytes, begin - 4, 4); at += 9) {
        if (bytes[at] != 0)
            break;
        const uint64_t bits = Big(bytes, at + 1, 8);
        out.emplace_back();
        std::memcpy(&out.back(), &bits, sizeof(bits));
    }
    return out;
}

Bytes WithoutIndex(Bytes bytes)
{
    bytes.at(Elements(bytes, KEYFRAMES) - 6) = '~'; // the property has another name then
    return bytes;
}

// What a seek can choose: the time that decides, the tag's own, and its place, 0 where it may not land.
struct Entry {
    uint32_t time = 0;
    uint32_t timestamp = 0;
    size_t pos = 0;
};

// A file, its frames in order, and what can be chosen by the list of its packets or by its own index.
struct Media {
    Bytes bytes;
    std::vector<ExpectedPacket> packets = {};
    Frames frames = {};
    uint32_t first_ts = 0, last_ts = 0;
    uint32_t stream = AUDIO; // the one that decides
    bool by_index = false;
    std::vector<Entry> entries = {};
};

Media Complete(Media media)
{
    for (const ExpectedPacket& packet : media.packets) {
        media.last_ts = std::max(media.last_ts, packet.timestamp);
        media.stream = std::min(media.stream, packet.stream);
    }
    const std::vector<double> times = Numbers(media.bytes, TIMES), positions = Numbers(media.bytes, POSITIONS);
    media.by_index = Elements(media.bytes, KEYFRAMES) < media.bytes.size();
    for (size_t i = 0; media.by_index && i < std::min(times.size(), positions.size()); ++i) {
        const double ms = times[i] * 1000.0;
        Entry entry{!(ms > 0) ? 0 : ms >= 0x1p32 ? UINT32_MAX : static_cast<uint32_t>(ms)};
        if (positions[i] >= 0 && positions[i] + 11 <= static_cast<double>(media.bytes.size())) {
            const auto pos = static_cast<size_t>(positions[i]); // whatever is there counts as a tag
            entry.timestamp = TagTime(media.bytes, pos);
            entry.pos = std::abs(int64_t{entry.timestamp} - entry.time) <= 1000 ? pos : 0;
        }
        media.entries.push_back(entry);
    }
    for (const ExpectedPacket& packet : media.packets)
        if (!media.by_index && packet.stream == media.stream && packet.key)
            media.entries.push_back({packet.timestamp, packet.timestamp, static_cast<size_t>(packet.pos)});
    return media;
}

Media Of(const Flv& flv)
{
    Media media{flv.bytes, {}, flv.frames(), flv.first_ts()};
    for (const Tag& tag : flv.tags)
        if (const bool key = tag.type == 8 || tag.is_keyframe(); tag.is_frame())
            media.packets.push_back({tag.stream(), tag.offset, tag.timestamp, 0, 0, key});
    return Complete(std::move(media));
}

Media OfSample(const std::string& name, bool hide_index)
{
    const Bytes bytes = ReadSample(name + ".flv");
    Media media{hide_index ? WithoutIndex(bytes) : bytes, ReadExpected(name).packets};
    FakeHost host(media.bytes);
    Session session(host);
    media.frames = play(session);
    EXPECT_TRUE(std::equal(media.packets.begin(), media.packets.end(), media.frames.begin(), media.frames.end(),
                           [](const auto& packet, const Frame& frame) { return SameFrame(packet, frame); }));
    return Complete(std::move(media));
}

size_t Told(fio_file_t* file)
{
    return static_cast<size_t>(__FLV_DMX__fioTell64(file));
}

enum class What { Stay, Rewind, Land, Miss, Fail };

// Plays and seeks, comparing every result with what the media's list asks for.
struct Player {
    const Media& m;
    const bool two, growing;
    Session session;
    std::array<size_t, 3> next{}; // frame that comes next; [0] with one reader, else by stream
    uint32_t current = 0;

    Player(FakeHost& host, const Media& media, const OpenOptions& options)
        : m(media), two((options.options & TWO) != 0), growing((options.options & GROWING) != 0), session(host, options)
    {
    }

    // The reader that seeks: the two are one without the option.
    fio_file_t* reader() const
    {
        const flvd_ctx_t* const ctx = session.ctx();
        return ctx == nullptr ? nullptr : m.stream == VIDEO ? ctx->main_reader : ctx->audio_reader;
    }

    // The first frame at or behind a place.
    size_t at(size_t pos) const
    {
        const auto behind = [pos](const auto& packet) { return static_cast<size_t>(packet.pos) >= pos; };
        return static_cast<size_t>(std::find_if(m.packets.begin(), m.packets.end(), behind) - m.packets.begin());
    }

    // Takes frames of each reader: those that follow in a play from the start.
    void deliver(size_t count)
    {
        for (uint32_t stream = two ? 1 : 0; stream <= (two ? 2 : 0); ++stream)
            for (size_t i = 0; i < count && (stream & session.ctx()->streams) == stream; ++i) {
                size_t& n = next.at(stream);
                while (n < m.frames.size() && stream != 0 && m.packets[n].stream != stream)
                    ++n;
                const FrameResult got = session.frame(stream);
                ASSERT_EQ(got.rc, n < m.frames.size() ? 0 : -2) << "frame " << n;
                if (got.rc != 0)
                    break;
                ASSERT_EQ(got.frame, m.frames[n++]) << "frame " << n - 1;
                current = got.frame.stream == m.stream ? got.frame.timestamp : current;
            }
    }

    // What the rules choose.
    std::pair<What, Entry> choose(int32_t time, uint32_t mode) const
    {
        const bool relative = (mode & REL) != 0;
        const int64_t now = int64_t{m.first_ts} + current, target = (relative ? now : m.first_ts) + time;
        const uint32_t forced = mode & FLVD_SEEK_DIRECTION_MASK;
        const bool backward = forced == BACK || (forced != FORTH && (relative ? time < 0 : target < now));
        if ((relative && time == 0) || target <= 0)
            return {relative && time == 0 ? What::Stay : What::Rewind, {}};
        const auto reaches = [target](const Entry& entry) { return entry.time >= target; };
        auto chosen = std::find_if(m.entries.begin(), m.entries.end(), reaches);
        const bool exact = chosen != m.entries.end() && chosen->time == target;
        if (target > (growing ? UINT32_MAX : m.last_ts) || (!backward && chosen == m.entries.end()))
            return {What::Miss, {}};
        if (backward && chosen == m.entries.begin() && (m.by_index || !exact))
            return {What::Rewind, {}};
        chosen -= backward && !exact ? 1 : 0;
        return {chosen->pos != 0 ? What::Land : What::Fail, *chosen};
    }

    // The readers stand where a seek puts them that reached this tag.
    void place(size_t pos, uint32_t timestamp)
    {
        current = timestamp - m.first_ts;
        next.fill(at(pos));
        if (!two || growing || m.stream == AUDIO || timestamp == m.first_ts)
            return;
        next[2] = 0; // the last sound at or before the picture, or none when the sound ends before it
        bool ended = true;
        for (size_t i = 0; i < m.packets.size(); ++i) {
            const bool sound = m.packets[i].stream == AUDIO;
            next[2] = sound && m.packets[i].timestamp <= timestamp ? i : next[2];
            ended = ended && !(sound && m.packets[i].timestamp >= timestamp);
        }
        next[2] = ended ? m.packets.size() : next[2];
    }

    // Does as chosen. When that is not known: fails as listed, or reaches a whole tag and tells its time.
    What seek(int32_t time, uint32_t mode, bool known = true)
    {
        auto [what, entry] = choose(time, mode);
        if (what == What::Miss && (mode & AT_END) != 0)
            next.fill(m.frames.size());
        if (what == What::Miss && (mode & RETRY) != 0)
            std::tie(what, entry) = choose(time, BACK);
        int32_t reached = UNTOUCHED;
        const int32_t rc = session.seek(time, mode, &reached);
        SCOPED_TRACE("seek " + std::to_string(time) + " mode " + std::to_string(mode) + " from " +
                     std::to_string(current) + " ends with " + std::to_string(rc));
        EXPECT_TRUE(rc == 0 || session.failed_as_listed(Op::Seek, rc)) << session.error_line();
        EXPECT_TRUE(!known || rc == (what == What::Miss ? -2 : what == What::Fail ? -1 : 0));
        EXPECT_EQ(__FLV_DMX__fioGetCacheReadSize(reader()), session.ctx()->cache_size);
        if (rc == 0 && what != What::Stay) {
            const size_t pos = Told(reader()), chosen = what == What::Rewind ? FIRST_TAG : entry.pos;
            const bool tag = pos > FIRST_TAG && pos < m.bytes.size(); // else at one of the ends
            const auto size = static_cast<size_t>(tag ? Big(m.bytes, pos + 1, 3) : 0);
            EXPECT_TRUE(!tag || Big(m.bytes, pos + 11 + size, 4) == size + 11) << pos;
            place(pos, tag ? TagTime(m.bytes, pos) : pos <= FIRST_TAG ? m.first_ts : m.last_ts);
            // a sound may as well be found at its configuration
            EXPECT_TRUE(!known || pos == chosen || (m.stream == AUDIO && at(pos) == at(chosen))) << pos;
        }
        EXPECT_EQ(reached, rc == 0 ? static_cast<int32_t>(current) : UNTOUCHED);
        return what;
    }
};

// Seeks all over the file, playing a little after each seek and to the end after the first to each place.
void SeekAround(const Media& media, const OpenOptions& options, int rounds, const std::vector<uint32_t>& modes)
{
    SCOPED_TRACE("options " + std::to_string(options.options));
    FakeHost host(media.bytes);
    Player player(host, media, options);
    ASSERT_TRUE(player.session.opened());
    ASSERT_EQ(player.session.ctx()->seek_method, media.by_index ? 1u : 2u);
    const auto length = static_cast<int32_t>(media.last_ts - media.first_ts) + 100;
    std::mt19937 random(options.options);
    std::set<std::pair<size_t, size_t>> played;
    for (const uint32_t mode : modes)
        for (int i = 0; i < rounds && !testing::Test::HasFailure(); ++i) {
            const bool relative = (mode & REL) != 0;
            auto time = static_cast<int32_t>(random() % static_cast<uint32_t>(relative ? 2 * length : length + 100));
            time = relative ? (time - length) / (i % 3 + 1) : time - 100;
            if (random() % 4 == 0) // exactly at a choice
                time = static_cast<int32_t>(media.entries.at(random() % media.entries.size()).time - media.first_ts -
                                            (relative ? player.current : 0));
            const What what = player.seek(i % 50 == 49 ? 0 : time, mode);
            const bool fresh = what == What::Land && played.insert({player.next[0], player.next[2]}).second;
            player.deliver(fresh ? ALL : random() % 3);
        }
}

TEST(Seek, LandsInTheSamplesAsTheirListsSay)
{
    const std::string indexed = "avc_aac_index",
                      samples[] = {"avc_aac", indexed,   "avc_bframes_aac", "avc_only", "h263_mp3",
                                   "screen",  "damaged", "truncated",       "aac_only"};
    for (const std::string& name : samples)
        for (const bool hide_index : {false, true}) {
            SCOPED_TRACE(name);
            if (hide_index && name != indexed)
                continue;
            const Media media = OfSample(name, hide_index);
            for (const uint32_t options : {ONE, TWO, MEMORY, MEMORY | TWO, GROWING, GROWING | TWO})
                if (media.by_index || (options | TWO) == TWO)
                    SeekAround(media, {options}, 1000, {AUTO, BACK, FORTH, REL});
        }
}

Flv Chain(uint32_t first_ts, bool index, bool video = true, uint32_t pictures = 50, uint32_t gop = 5)
{
    return MakeChain({video, true, true, index, pictures, gop, first_ts});
}

// The first keyframe after 200 ms; configurations beside and between keyframes and ends of sequence in the middle, all
// of them keyframes by their FrameType. The sound ends early.
Flv Configured()
{
    FlvBuilder builder;
    builder.metadata({}).video(0, AvcConfig(SmallAvcRecord())).audio(0, AacConfig({0x12, 0x10}));
    for (uint32_t i = 0; i < 60; ++i) {
        if (i % 4 == 0)
            builder.video(i * 40, i % 5 == 0 ? AvcConfig(SmallAvcRecord()) : AvcEnd());
        if (i % 10 == 5)
            builder.video(i * 40, AvcConfig(SmallAvcRecord()));
        builder.video(i * 40, AvcNalu(i % 10 == 5, Noise(200, i)));
        if (i < 50)
            builder.audio(i * 40 + 3, AacRaw(Noise(50, i)));
    }
    return builder.video(59 * 40, AvcEnd()).build();
}

TEST(Seek, LandsInFilesOfEveryShape)
{
    const std::pair<Flv, std::vector<uint32_t>> shapes[] = {{Configured(), {ONE, TWO}},
                                                            {Chain(1000, false), {ONE, TWO}},
                                                            {Chain(1000, true), {ONE, TWO, MEMORY, MEMORY | TWO}},
                                                            {Chain(3000000000, false), {ONE, TWO}},
                                                            {Chain(3000000000, true), {ONE, MEMORY | TWO}},
                                                            {Chain(1000, false, false), {ONE, TWO}},
                                                            {Chain(0, true), {GROWING, GROWING | TWO}}};
    for (const auto& [flv, arrangements] : shapes)
        for (const uint32_t options : arrangements)
            for (const uint32_t quantum : {0u, 4096u}) // of scanning: the usual one, the whole cache
                SeekAround(Of(flv), {options, false, 0, quantum}, 60,
                           {AUTO, BACK, FORTH, BACK | FORTH, REL, REL | BACK, REL | FORTH, FORTH | RETRY, REL | RETRY,
                            REL | AT_END, FORTH | AT_END, REL | RETRY | AT_END, AUTO});
}

// Bytes put over what the index says, from an element of an array on.
struct Lie {
    const std::string& key;
    int offset;
    std::vector<Bytes> all;
};

using amf::Number;
const double g_nan = std::nan("");
const Bytes g_string{2, 0, 6, 'a', 'b', 'c', 'd', 'e', 'f'}; // as long as a number
constexpr int FOURTH = 27, LAST_ONE = 81, COUNT = -1, COUNT_TOP = -4, NAME = -6;
const Lie g_lies[] = {
    {TIMES, FOURTH, {Number(4), Number(0.5), Number(-1), Number(g_nan), Number(HUGE_VAL), Number(5e6), g_string, {1}}},
    {TIMES, FOURTH, {Number(2.5), Number(2.5015)}}, // 1000 and 1001 ms off
    {TIMES, 0, {g_string}},
    {TIMES, LAST_ONE, {Number(0)}},
    {TIMES, COUNT, {{4}, {200}}},
    {TIMES, NAME, {{'~'}}},
    {POSITIONS, FOURTH, {Number(1e6), Number(-2000), Number(1e300), Number(g_nan), g_string, {5}}},
    {POSITIONS, FOURTH, {Number(2000), Number(2001), Number(2002)}}, // inside a payload
    {POSITIONS, LAST_ONE, {Number(1e6), Number(0), g_string}},
    {POSITIONS, COUNT, {{0}, {1}, {3}, {200}}},
    {POSITIONS, COUNT_TOP, {{0x7F}}},
    {POSITIONS, NAME, {{'~'}}}};

void SeekByLyingIndex(const Media& media, uint32_t options, bool known, uint64_t failing_alloc)
{
    FakeHost host(media.bytes);
    host.fail_nth(HostFn::Alloc, failing_alloc);
    Player player(host, media, {options});
    ASSERT_TRUE(player.session.opened());
    for (int32_t time = 4950; time > -100 && !testing::Test::HasFailure(); time -= 25) {
        player.seek(time, time % 50 == 0 ? BACK : FORTH, known);
        player.deliver(static_cast<size_t>(time & 1));
    }
}

TEST(Seek, SurvivesIndexesThatLie)
{
    FlvBuilder builder;
    builder.indexed_metadata({}).video(0, AvcConfig(SmallAvcRecord()));
    for (uint32_t i = 0; i < 50; ++i)
        builder.video(i * 100, AvcNalu(i % 5 == 0, Noise(200, i)));
    for (const Lie& lie : g_lies)
        for (const Bytes& by : lie.all)
            for (const uint32_t options : {ONE, MEMORY, GROWING, MEMORY | TWO}) {
                SCOPED_TRACE("lie " + lie.key + std::to_string(by.back()) + " options " + std::to_string(options));
                Flv flv = builder.build();
                std::copy(by.begin(), by.end(), &flv.bytes[Elements(flv.bytes, lie.key)] + lie.offset);
                const bool number = by.size() == 9 && (by[0] == 0 || (options == ONE && &lie.key == &TIMES));
                SeekByLyingIndex(Of(flv), options, number, 0);
            }
    for (const char* key : {"times", "filepositions"}) { // one array of the two is replaced by a longer one
        FlvBuilder twice = builder;
        const Bytes longer = amf::NumberArray(std::vector<double>(11, 0));
        twice.metadata({{"keyframes", amf::Object({{key, longer}})}});
        for (const uint32_t options : {ONE, MEMORY, GROWING})
            SeekByLyingIndex(Of(twice.build()), options, false, 0);
    }
    Media media = Of(builder.build());
    media.entries.clear();
    for (const uint64_t array : {5u, 6u}) // allocated behind instance, reader, cache and frame buffer
        for (const uint32_t options : {MEMORY, GROWING})
            SeekByLyingIndex(media, options, options == MEMORY, array);
}

constexpr uint32_t TIME = 0, BEFORE = 1, AFTER = 0, INFO = 1u << 31;

TEST(Seek, TellsEachFailureByItsLine)
{
    const Flv scan = Chain(0, false), index = Chain(0, true), audio = Chain(0, false, false);
    const Flv one = Chain(0, true, true, 50, 50);
    FlvBuilder builder;
    builder.indexed_metadata({}, [](auto& t, auto& p) { t[3] = 1.6015, t[4] = 1.8, p[4] = 1e9; });
    builder.video(0, AvcConfig(SmallAvcRecord()));
    for (const uint32_t time : {0u, 200u, 400u, 600u, 2000u})
        builder.video(time, AvcNalu(true, Noise(99)));
    const Flv lying = builder.build();
    const auto hide = [](FlvBuilder hidden, bool pictures) { // all tags of one stream are later than the file's end
        for (uint32_t time = 1538; time <= 1978; time += 40)
            hidden.add(pictures ? Nalu(time, 60) : Pcm(time));
        return hidden.build();
    };
    const Flv no_picture = hide(FlvBuilder().add(Screen(90000)), false);
    const Flv no_sound = hide(FlvBuilder().add(g_avc).add(Pcm(90000)), true);
    Flv text = index;
    std::copy(g_string.begin(), g_string.end(), &text.bytes[Elements(text.bytes, POSITIONS) + 36]);
    // A time seek, or the frame seek of a stream with its direction; those that a failing host leads to are in the
    // fault sweep.
    struct Case {
        const Flv& flv;
        uint32_t options, stream;
        int32_t time;
        uint32_t mode;
        int32_t rc, code, line;
    };
    const Case cases[] = {{scan, INFO, TIME, 100, AUTO, -1, -4007, 2982},
                          {one, ONE, TIME, 100, AUTO, -1, -10003, 2987},
                          {scan, ONE, TIME, 9000, AUTO, -2, -2003, 3161},
                          {scan, ONE, TIME, 1950, FORTH, -2, -2003, 3161},
                          {index, GROWING | INFO, TIME, 100, AUTO, -1, -4007, 3190},
                          {scan, GROWING, TIME, 100, AUTO, -1, -10003, 3195},
                          {audio, GROWING, TIME, 100, AUTO, -1, -10003, 3195},
                          {index, GROWING, TIME, 9000, AUTO, -2, -2003, 3338},
                          {text, ONE, VIDEO, 800, AFTER, -1, -2007, 325},
                          {lying, ONE, VIDEO, 1800, AFTER, -1, -10002, 342},
                          {lying, ONE, VIDEO, 1601, BEFORE, -1, -2006, 355},
                          {lying, MEMORY, VIDEO, 1800, AFTER, -1, -10002, 439},
                          {lying, MEMORY, VIDEO, 1601, BEFORE, -1, -2006, 452},
                          {one, ONE, VIDEO, 900, BEFORE, -1, -10003, 844},
                          {index, ONE, AUDIO, 1979, BEFORE, 0, 0, 0}, // nothing is recorded from here on
                          {index, ONE, AUDIO, 1979, AFTER, 0, 0, 0},
                          {index, ONE, VIDEO, 1801, AFTER, -101, 0, 0},
                          {scan, ONE, VIDEO, 1950, AFTER, -101, 0, 0},
                          {no_picture, ONE, VIDEO, 1700, AFTER, -101, 0, 0},
                          {no_sound, TWO, AUDIO, 1700, AFTER, 0, 0, 0},
                          {index, GROWING, AUDIO, 900, BEFORE, -1, 0, 0}};
    for (const Case& c : cases) {
        FakeHost host(c.flv.bytes);
        Session session(host, {c.options, (c.options & INFO) != 0});
        uint32_t result = 0;
        const auto seek = (c.options & GROWING) != 0 ? FLVD_RunFrameSeekProgressive : FLVD_RunFrameSeek;
        const int32_t rc = c.stream == TIME
                               ? session.seek(c.time, c.mode)
                               : seek(session.ctx(), static_cast<uint32_t>(c.time), &result, c.stream, c.mode);
        EXPECT_EQ(std::tuple(rc, session.last_error(), session.error_line()), std::tie(c.rc, c.code, c.line));
        EXPECT_EQ(result, rc == 0 ? 1978u : result); // the last timestamp
    }
}

TEST(Seek, UsesTheEntriesThatBothArraysHave)
{
    // One array of two entries outside "keyframes", the other of five inside: only a growing file takes these.
    for (const bool short_times : {true, false}) {
        const auto build = [short_times](const Flv& flv) {
            std::vector<double> numbers[2];
            for (const Tag& tag : flv.tags) {
                numbers[0].push_back(tag.timestamp / 1000.0);
                numbers[1].push_back(static_cast<double>(tag.offset));
            }
            numbers[short_times ? 0 : 1].resize(2);
            const amf::Property times("times", amf::NumberArray(numbers[0])),
                positions("filepositions", amf::NumberArray(numbers[1]));
            FlvBuilder builder(1);
            builder.metadata(
                {short_times ? times : positions, {"keyframes", amf::Object({short_times ? positions : times})}});
            for (uint32_t i = 0; i < 4; ++i)
                builder.add(Screen(i * 2000));
            return builder.build();
        };
        const Flv draft = build(File({g_meta, Screen(0), Screen(2000), Screen(4000), Screen(6000)}));
        FakeHost host(build(draft).bytes);
        Session session(host, {GROWING});
        int32_t reached = UNTOUCHED;
        EXPECT_EQ(session.seek(5000, BACK, &reached), 0);
        EXPECT_EQ(reached, 0);
    }
}

TEST(Seek, InAFileThatStillGrows)
{
    const Media media = Of(Chain(0, true));
    for (const uint32_t options : {GROWING, GROWING | TWO}) {
        FakeHost host(media.bytes);
        Player player(host, media, {options});
        host.set_visible(static_cast<int64_t>(media.entries[6].pos) + 10); // of the 11 bytes that are looked at
        player.seek(800, BACK);
        player.deliver(1);
        EXPECT_EQ(player.session.seek(1300, BACK), -1);
        player.deliver(2);
        host.grow(1);
        const uint32_t sound = player.session.ctx()->last_audio_ts;
        player.seek(1300, BACK); // to a tag of which no more is there
        EXPECT_EQ(player.session.ctx()->last_audio_ts, player.two ? 1200 : sound);
        host.fail_from(HostFn::Seek, host.calls(HostFn::Seek) + 1);
        EXPECT_EQ(player.session.frame(VIDEO).rc, -1); // and which cannot be gone back to now, so it has to wait
        host.fail_nothing();
        player.seek(0, REL); // what moves nothing or fails leaves it waiting
        player.seek(9000, FORTH);
        host.grow(ALL);
        player.deliver(ALL);
    }
}

TEST(Seek, ForgetsAPlaceThatItCouldNotGoBackTo)
{
    const Media media = Of(Chain(0, false));
    FakeHost host(media.bytes);
    Player player(host, media, {ONE});
    player.deliver(3);
    host.fail_from(HostFn::Seek, host.calls(HostFn::Seek) + 1);
    EXPECT_EQ(player.session.seek(1000, BACK), -1);
    host.fail_nothing();
    player.place(Told(player.reader()), 0);
    player.deliver(9);
    player.seek(1950, FORTH);
    player.deliver(9);
}

TEST(Seek, CostsLittle)
{
    constexpr uint32_t GOP = 50, PICTURES = 15000; // ten minutes, a keyframe every two seconds
    const Flv flv = Chain(0, true, true, PICTURES, GOP);
    std::mt19937 random(1);
    for (const bool indexed : {true, false}) {
        // A scan passes the tags of two groups of pictures, the sound's (23 ms a frame) among them: six host calls and
        // two narrow reads for each, and four caches to find a tag at the place where it begins.
        constexpr uint64_t TAGS = 2 * GOP * (23 + 40) / 23, CACHE = 4096;
        const uint64_t most_calls = indexed ? 3 : 6 * TAGS, most_bytes = indexed ? CACHE : TAGS * 2 * 16 + 4 * CACHE;
        FakeHost host(indexed ? flv.bytes : WithoutIndex(flv.bytes));
        Session session(host, {MEMORY});
        for (int32_t i = 0; i < 300; ++i) {
            const auto time = static_cast<int32_t>(random() % (PICTURES * 40 - GOP * 40)), forth = i % 2;
            int32_t reached = UNTOUCHED;
            host.reset_calls();
            ASSERT_EQ(session.seek(time, forth != 0 ? FORTH : BACK, &reached), 0);
            ASSERT_EQ(reached, (time + forth * 1999) / 2000 * 2000);
            ASSERT_LE(host.calls(HostFn::Read), indexed ? 1 : most_calls);
            ASSERT_LE(host.io_calls() + host.calls(HostFn::Eof), most_calls);
            ASSERT_LE(host.bytes_read(), most_bytes);
            ASSERT_EQ(session.frame().rc, 0);
        }
    }
}

// 360 pictures of 12 MiB, one a second and every third a keyframe, and a little sound behind each.
constexpr uint32_t PICTURE = 12u << 20, SECONDS = 360;

int64_t AddHugeFile(FakeHost& host, bool index)
{
    std::vector<double> times(SECONDS / 3), positions(SECONDS / 3);
    const auto copy = [&](auto& t, auto& p) { t = times, p = positions; };
    FlvBuilder builder;
    builder.indexed_metadata({}, copy).video(0, AvcConfig(SmallAvcRecord())).audio(0, AacConfig({0x12, 0x10}));
    auto size = static_cast<int64_t>(builder.build().bytes.size());
    std::map<int64_t, Bytes> extents;
    for (uint32_t i = 0; i < SECONDS; ++i) {
        const uint64_t ms = uint64_t{i} * 1000;
        if (i % 3 == 0)
            times[i / 3] = i, positions[i / 3] = static_cast<double>(size);
        Bytes begin{9}, end;
        Put(begin, PICTURE, 3), Put(begin, ms, 3), Put(begin, 0, 4), Append(begin, AvcNalu(i % 3 == 0, {7}));
        Put(end, PICTURE + 11, 4), Put(end, 0x08000006, 4), Put(end, ms + 10, 3), Put(end, 0, 4);
        Append(end, AacRaw({1, 2, 3, 4})), Put(end, 17, 4);
        extents[size] = begin;
        extents[size + 11 + PICTURE] = end;
        size += 11 + PICTURE + static_cast<int64_t>(end.size());
    }
    extents[0] = index ? builder.build().bytes : WithoutIndex(builder.build().bytes);
    host.add_sparse_file(FakeHost::DEFAULT_FILE, size, extents);
    return size;
}

// Seeks, and plays the picture reached and the sound behind it.
int32_t SeekHuge(Session& session, int32_t time, uint32_t mode)
{
    int32_t reached = UNTOUCHED;
    FakeHost::current().reset_calls();
    if (session.seek(time, mode, &reached) == 0) {
        EXPECT_LT(FakeHost::current().io_calls(), mode == BACK ? 500u : 5000u); // the estimate has more than 32 bits
        const FrameResult picture = session.frame(), sound = session.frame();
        EXPECT_EQ(picture.frame.timestamp, static_cast<uint32_t>(reached));
        EXPECT_EQ(picture.frame.data.size(), PICTURE - 5);
        EXPECT_EQ(sound.frame, (Frame{AUDIO, static_cast<uint32_t>(reached) + 10, {1, 2, 3, 4}}));
    }
    return reached;
}

TEST(Seek, BeyondFourGiB)
{
    for (const uint32_t options : {INFO, ONE, MEMORY, GROWING}) { // the first without index
        SCOPED_TRACE("options " + std::to_string(options));
        FakeHost host;
        EXPECT_GT(AddHugeFile(host, options != INFO), int64_t{4} << 30);
        Session session(host, {options & ~INFO});
        EXPECT_EQ(SeekHuge(session, 340100, FORTH), 342000);
        EXPECT_EQ(SeekHuge(session, 358000, BACK), 357000);
        EXPECT_EQ(SeekHuge(session, 10100, FORTH), 12000);
    }
}

TEST(Seek, FailsBeyondTwoGiBWith32Bits)
{
    FakeHost host;
    host.use_32_bit_only();
    AddHugeFile(host, true);
    EXPECT_EQ(Session(host, {ONE}).open_rc(), -1); // the end cannot be asked for
    Session session(host, {GROWING});
    EXPECT_EQ(SeekHuge(session, 100000, BACK), 99000);
    for (const int32_t time : {200000, 300000, 345000, 357000}) {
        EXPECT_EQ(SeekHuge(session, time, BACK), UNTOUCHED);
        EXPECT_EQ(session.error_line(), 3276);
    }
    EXPECT_EQ(session.frame().frame.timestamp, 100000u);
}

} // namespace
