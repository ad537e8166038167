// Seeking: where it lands, what is delivered after it, and that a failed seek does not move the reader.

#include "support/expected.h"
#include "support/report.h"
#include "support/session.h"

#include <algorithm>
#include <optional>
#include <random>
#include <set>

using namespace flvd_test;

namespace {

using enum Site;

constexpr uint32_t AUTO = 0, ONE = 0, TWO = SEPARATE, TIME = 0, INFO = 1u << 31, EACH = 1u << 30;
constexpr int32_t UNTOUCHED = -77777;
// What a seek may choose instead of a tag: nothing, the current position, a rewind, and the first tag. The last two go
// to the end of the file header.
constexpr int64_t NOWHERE = 0, HERE = 1, REWIND = 2, FIRST_TAG = 9;
constexpr size_t ALL = 100000;
constexpr int64_t NONE = -1;

// Where the elements of a script array start; past the end of the file if it has no such key.
size_t Elements(const Bytes& bytes, const std::string& key)
{
    const auto name = std::search(bytes.begin(), bytes.end(), key.begin(), key.end());
    return static_cast<size_t>(name - bytes.begin()) + key.size() + 5;
}

Flv WithoutIndex(Flv flv)
{
    flv.bytes.at(Elements(flv.bytes, "keyframes") - 6) = '~'; // changes the name of the property
    return flv;
}

// A file, its frames in order, and those that a seek may choose, with the times used to choose.
struct Media {
    Bytes bytes;
    Frames frames;
    uint32_t stream; // the one in which seeks search
    uint32_t first_ts, last_ts = 0;
    bool by_index, audio;
    Tags tags, keys; // of the frames

    // index_lag: ms by which the times in the index are too low
    explicit Media(const Flv& flv, uint32_t index_lag = 0)
        : bytes(flv.bytes), frames(flv.frames()), stream((bytes[4] & 1) != 0 ? VIDEO : AUDIO), first_ts(flv.first_ts()),
          by_index(Elements(bytes, "keyframes") < bytes.size()), audio(!flv.frames(AUDIO).empty())
    {
        std::copy_if(flv.tags.begin(), flv.tags.end(), std::back_inserter(tags), std::mem_fn(&Tag::is_frame));
        for (Tag tag : tags) {
            last_ts = std::max(last_ts, tag.timestamp);
            if (by_index) // the index is in seconds
                tag.timestamp = static_cast<uint32_t>((tag.timestamp - index_lag) / 1000.0 * 1000.0);
            if (tag.stream() == stream && (stream == AUDIO || tag.is_keyframe()))
                keys.push_back(tag);
        }
    }
};

// Plays and seeks, and compares every result with what follows from the lists of the media.
struct Player {
    const Media& m;
    Session session;
    std::array<size_t, 3> next{};    // next frame; [0] with one reader, else by stream
    std::array<uint32_t, 3> times{}; // of the last frame of each stream, or set by a seek

    Player(FakeHost& host, const Media& media, const OpenOptions& options) : m(media), session(host, options) {}

    bool has(uint32_t option) const { return (session.ctx()->options & option) != 0; }
    // The reader that seeks. Without the option, both are the same.
    fio_file_t* reader() const { return m.stream == VIDEO ? session.ctx()->main_reader : session.ctx()->audio_reader; }

    uint32_t& current() { return times.at(m.stream); }
    // The first frame at or after a position.
    size_t at(int64_t pos) const
    {
        const auto before = [pos](const Tag& tag) { return tag.offset < pos; };
        return static_cast<size_t>(std::count_if(m.tags.begin(), m.tags.end(), before));
    }

    // Requests frames of each reader, which must be the next ones of the file.
    void deliver(size_t count)
    {
        for (const uint32_t stream : has(TWO) ? std::vector{VIDEO, AUDIO} : std::vector{0u})
            for (size_t i = 0; i < count && (stream & session.ctx()->streams) == stream; ++i) {
                size_t& n = next.at(stream);
                while (n < m.frames.size() && stream != 0 && m.frames[n].stream != stream)
                    ++n;
                const FrameResult got = session.frame(stream);
                ASSERT_EQ(got.rc, n < m.frames.size() ? 0 : -2) << "frame " << n;
                if (got.rc != 0)
                    break;
                ASSERT_EQ(got.frame, m.frames[n++]) << "frame " << n - 1;
                times.at(got.frame.stream) = got.frame.timestamp;
            }
    }

    // The position that a seek must choose.
    int64_t choose(int32_t time, uint32_t mode)
    {
        const bool relative = (mode & REL) != 0;
        const int64_t now = int64_t{m.first_ts} + current(), target = (relative ? now : m.first_ts) + time;
        const uint32_t forced = mode & FLVD_SEEK_DIRECTION_MASK;
        const bool backward = forced == BACK || (forced != FORTH && target < now);
        if ((relative && time == 0) || target <= 0)
            return relative && time == 0 ? HERE : REWIND;
        const auto reaches = [target](const Tag& key) { return key.timestamp >= target; };
        auto chosen = std::find_if(m.keys.begin(), m.keys.end(), reaches);
        const bool exact = chosen != m.keys.end() && chosen->timestamp == target;
        if (target > (has(GROWING) ? UINT32_MAX : m.last_ts) || (!backward && chosen == m.keys.end()))
            return NOWHERE;
        if (backward && chosen == m.keys.begin() && (m.by_index || !exact))
            return FIRST_TAG;
        return (backward && !exact ? chosen - 1 : chosen)->offset;
    }

    // Sets the state after a seek to this position. In a growing file, the seek does not move a separate audio reader
    // to the time of the video frame.
    void place(int64_t pos, bool rewound = false)
    {
        next.fill(at(pos));
        const uint32_t time = next[0] < m.tags.size() ? m.tags[next[0]].timestamp : m.last_ts;
        const bool moves = m.audio && (rewound || !has(GROWING) || has(TWO));
        times = {0, m.stream == VIDEO ? time - m.first_ts : 0, moves ? time - m.first_ts : times[AUDIO]};
        if (!has(TWO) || has(GROWING) || m.stream == AUDIO || time == m.first_ts)
            return;
        uint32_t last = 0;
        next[2] = 0; // the last audio frame at or before the video frame; none if audio ends before it
        for (size_t i = 0; i < m.tags.size(); ++i) {
            last = m.tags[i].type == 8 ? m.tags[i].timestamp : last;
            next[2] = m.tags[i].type == 8 && last <= time ? i : next[2];
        }
        next[2] = last < time ? m.tags.size() : next[2];
        if (m.audio)
            times[AUDIO] = (last < time ? m.last_ts : m.tags[next[2]].timestamp) - m.first_ts;
    }

    // Seeks, checks the result and returns the position chosen.
    int64_t seek(int32_t time, uint32_t mode)
    {
        int64_t chosen = choose(time, mode);
        if (chosen == NOWHERE && (mode & AT_END) != 0)
            next.fill(m.frames.size());
        if (chosen == NOWHERE && (mode & RETRY) != 0)
            chosen = choose(time, BACK);
        int32_t reached = UNTOUCHED;
        const uint32_t size = session.ctx()->last_frame_size;
        const int32_t rc = session.seek(time, mode, &reached);
        SCOPED_TRACE(testing::PrintToString(std::tuple(time, mode, current(), rc)));
        EXPECT_TRUE(rc == 0 || session.failed_as_listed(Op::Seek, rc)) << session.error_line();
        EXPECT_EQ(rc, chosen == NOWHERE ? -2 : 0);
        EXPECT_EQ(__FLV_DMX__fioGetCacheReadSize(reader()), session.ctx()->cache_size);
        const bool rewinds = chosen == REWIND;
        chosen = rewinds ? FIRST_TAG : chosen;
        if (const int64_t pos = __FLV_DMX__fioTell64(reader()); rc == 0 && chosen != HERE) {
            place(pos, rewinds);
            // audio may also land on its configuration
            EXPECT_TRUE(m.stream == AUDIO ? at(chosen) == at(pos) : chosen == pos) << pos;
        }
        EXPECT_EQ(reached, rc == 0 ? static_cast<int32_t>(current()) : UNTOUCHED);
        EXPECT_EQ(session.ctx()->last_video_ts, times[VIDEO]);
        EXPECT_EQ(session.ctx()->last_audio_ts, times[AUDIO]);
        EXPECT_EQ(session.ctx()->last_frame_size, size);
        return chosen;
    }
};

// Seeks all over the file. Plays a little after each seek, and to the end after the first seek to each position.
void SeekAround(const Media& media, const OpenOptions& options)
{
    FakeHost host(media.bytes);
    Player player(host, media, options);
    ASSERT_EQ(player.session.open_rc(), 0);
    ASSERT_EQ(player.session.ctx()->seek_method, media.by_index ? 1u : 2u);
    std::mt19937 random(options.options);
    std::set<std::pair<size_t, size_t>> played;
    for (const uint32_t mode : {AUTO, BACK, FORTH, BACK | FORTH, REL, REL | BACK, REL | FORTH, FORTH | RETRY,
                                REL | RETRY, REL | AT_END, FORTH | AT_END, REL | RETRY | AT_END, AUTO})
        for (int i = 0; i < 100 && !testing::Test::HasFailure(); ++i) {
            auto time = static_cast<uint32_t>(random() % (media.last_ts - media.first_ts + 1300) - 1200);
            if (random() % 4 == 0) // exactly to a keyframe
                time = media.keys.at(random() % media.keys.size()).timestamp - media.first_ts;
            time = i % 50 == 49 ? 0 : (mode & REL) != 0 ? time - player.current() : time;
            const int64_t place = player.seek(static_cast<int32_t>(time), mode);
            const bool fresh = place > FIRST_TAG && played.insert({player.next[0], player.next[2]}).second;
            player.deliver(fresh ? ALL : random() % 3);
        }
}

const Bytes g_string{2, 0, 6, 'a', 'b', 'c', 'd', 'e', 'f'}; // as long as a number

Flv Chain(uint32_t first_ts, bool index, bool video = true, uint32_t pictures = 50, uint32_t gop = 5)
{
    return MakeChain({video, true, true, index, pictures, gop, first_ts});
}

// The first keyframe comes after 200 ms. Configurations next to and between keyframes, and ends of sequence in the
// middle, all have the FrameType of a keyframe. Audio ends early.
Flv Configured()
{
    Tags tags;
    for (const Tag& tag : Chain(0, false, true, 60, 10).tags) {
        const uint32_t time = tag.timestamp;
        if (tag.type == 9 && time % 160 == 0)
            tags.push_back({9, time, time % 200 == 0 ? g_avc.data : g_avc_end});
        if (tag.is_keyframe())
            tags.push_back({9, time, g_avc.data});
        if (tag.type == 9 ? time != 0 : time < 2000)
            tags.push_back(tag);
    }
    tags.push_back({9, 2360, g_avc_end});
    return File(tags);
}

TEST(Seek, LandsOnTheRightFrame)
{
    std::vector<Media> all = {Media(ReadExpected("avc_aac_index"), 23),
                              Media(WithoutIndex(ReadExpected("avc_aac_index")))};
    for (const char* sample :
         {"avc_aac", "avc_bframes_aac", "avc_only", "h263_mp3", "screen", "damaged", "truncated", "aac_only"})
        all.emplace_back(ReadExpected(sample));
    for (const Flv& flv : {Configured(), Chain(1000, false), Chain(1000, true), Chain(3000000000, false),
                           Chain(3000000000, true), Chain(1000, false, false), Chain(0, true)})
        all.emplace_back(flv);
    for (const Media& media : all)
        for (const uint32_t options : {ONE, TWO, INDEX, INDEX | TWO, GROWING, GROWING | TWO})
            for (const uint32_t read_size : {0u, 4096u}) { // while scanning: the default, the whole cache
                SCOPED_TRACE(testing::PrintToString(std::pair(&media - all.data(), options)));
                if (media.by_index ? (options & GROWING) == 0 || media.first_ts == 0 : (options | TWO) == TWO)
                    SeekAround(media, {options, false, 0, read_size});
            }
}

// Failures caused by the host are in the fault sweep.
TEST(Seek, ReportsTheTimeReachedOrTheFailure)
{
    const Flv scan = Chain(0, false), index = Chain(0, true), audio = Chain(0, false, false);
    const Flv one_entry = Chain(0, true, true, 50, 50);
    // Tags at 0, 200, 400, 600 and 2000 ms; the index has wrong times for the last three, and a wrong position for the
    // last.
    const Flv odd = IndexedFile({g_avc, Nalu(0), Nalu(200), Nalu(400), Nalu(600), Nalu(2000)},
                                [](auto& t, auto& p) { t[2] = 1.4, t[3] = 1.6015, t[4] = 1.8, p[4] = 1e9; });
    const std::string fewer_positions = "filepositions: [2 13 13 keyframes: { times: [5 0 0.2 0.4 0.6 0.8 }";
    const Flv two_positions = File({{18, 0, OnMetaData(fewer_positions)}, Screen(0)}, 1);
    // The entry at 200 ms points to position 5, where the file header looks like a tag at 0 ms.
    const Flv in_header = MakeChain({true, true, true, true, 50, 5, 0, [](auto&, auto& p) { p[1] = 5; }});
    // The first tag of one stream is later than the file's last time, so none is found; the other starts at 1538 ms.
    const auto without = [](Tags late, const auto& tag) {
        for (uint32_t time = 1538; time <= 1978; time += 40)
            late.push_back(tag(time, 60));
        return File(late);
    };
    const Flv no_video = without({Screen(90000)}, Pcm), mute = without({g_avc, Pcm(90000)}, Nalu);
    const Flv ended = Configured(); // audio up to 1978 ms, video up to 2360
    const int64_t end = ended.size();
    // The times are the last bytes of the file, and some of them are removed after opening. A missing element counts as
    // 0.0. If two in a row are missing, the index ends with its last entry, at 0 s, which is near enough to its tag at
    // 800 ms.
    Tags pictures = {g_avc, Nalu(0), Nalu(200), Nalu(400), Nalu(600), Nalu(800)};
    std::string positions = "filepositions: [5";
    for (size_t i = 0; const Tag& tag : File(pictures, 1).tags)
        positions += i++ != 0 ? " " + std::to_string(tag.offset) : "";
    pictures.push_back({18, 0, OnMetaData("keyframes: { " + positions + " times: [5 0 0.2 0.4 0.6 0.8 }")});
    const Flv cut = File(pictures, 1);
    Flv text = index; // in the positions, the entry at 800 ms is a string, in the times the one of 1600 ms
    for (const auto& [key, element] : {std::pair("filepositions", 4 * 9), {"times", 8 * 9}})
        std::copy(g_string.begin(), g_string.end(), &text.bytes[Elements(text.bytes, key)] + element);
    const struct {
        const char* what;
        const Flv& flv;
        uint32_t open = ONE, stream = TIME; // TIME: a time seek; otherwise a frame seek in the stream
        uint32_t to = 0, mode = AUTO;       // EACH: both directions in turn
        std::optional<Site> site = {};      // where it fails
        int32_t rc = 0;                     // without a site
        uint32_t reached = 0;
        int64_t at = HERE;        // where the reader stands afterwards; HERE: not checked
        int64_t left = INT32_MAX; // bytes left from the times on; NONE: nothing can be read
    } rows[] = {
        {.what = "opened for information", .flv = scan, .open = INFO, .to = 100, .site = SEEK_INFO_ONLY},
        {.what = "growing: no index", .flv = scan, .open = GROWING, .to = 100, .site = SEEK_NOT_SEEKABLE},
        {.what = "growing: no video", .flv = audio, .open = GROWING, .to = 100, .site = SEEK_NOT_SEEKABLE},
        {.what = "growing: audio", .flv = index, .open = GROWING, .stream = AUDIO, .to = 900, .rc = -1},
        {.what = "growing: fewer positions", .flv = two_positions, .open = GROWING, .to = 1900, .mode = BACK},
        {.what = "index of one entry", .flv = one_entry, .to = 100, .site = SEEK_NOT_SEEKABLE},
        {.what = "frame seek in it", .flv = one_entry, .stream = VIDEO, .to = 900, .mode = BACK, .site = SEEK_METHOD},
        {.what = "after the last time", .flv = scan, .to = 9000, .site = SEEK_MISS},
        {.what = "growing: after the last entry", .flv = index, .open = GROWING, .to = 9000, .site = SEEK_MISS},
        {.what = "after the last keyframe", .flv = scan, .to = 1950, .mode = FORTH, .site = SEEK_MISS},
        {.what = "frame seek there", .flv = scan, .stream = VIDEO, .to = 1950, .rc = -101, .reached = 1978},
        {.what = "frame seek there by index", .flv = index, .stream = VIDEO, .to = 1801, .rc = -101},
        {.what = "position past the end", .flv = odd, .stream = VIDEO, .to = 1800, .site = FILE_INDEX_TAG_CUT},
        {.what = "memory", .flv = odd, .open = INDEX, .stream = VIDEO, .to = 1800, .site = MEMORY_INDEX_TAG_CUT},
        {.what = "1001 ms off the tag", .flv = odd, .stream = VIDEO, .to = 1601, .site = FILE_INDEX_TOLERANCE},
        {.what = "memory", .flv = odd, .open = INDEX, .stream = VIDEO, .to = 1601, .site = MEMORY_INDEX_TOLERANCE},
        {.what = "1000 ms off the tag", .flv = odd, .stream = VIDEO, .to = 1400, .mode = BACK, .reached = 400},
        {.what = "before an entry with a wrong time", .flv = odd, .to = 700, .mode = BACK, .reached = 200},
        {.what = "string as a position", .flv = text, .stream = VIDEO, .to = 800, .site = FILE_INDEX_POSITION_TYPE},
        {.what = "string ends the times", .flv = text, .stream = VIDEO, .to = 1900, .mode = BACK, .reached = 1400},
        {.what = "position in the file header", .flv = in_header, .stream = VIDEO, .to = 200, .at = 5},
        {.what = "no video", .flv = no_video, .stream = VIDEO, .to = 1700, .mode = EACH, .reached = 1538, .at = 9},
        {.what = "mute", .flv = mute, .open = TWO, .stream = AUDIO, .to = 1700, .mode = EACH, .reached = 1538, .at = 9},
        {.what = "audio ends the file", .flv = index, .stream = AUDIO, .to = 1979, .mode = EACH, .reached = 1978},
        {.what = "after audio", .flv = ended, .stream = AUDIO, .to = 2100, .mode = EACH, .reached = 2360, .at = end},
        {.what = "1 ms later", .flv = ended, .stream = AUDIO, .to = 1979, .mode = BACK, .reached = 2360, .at = end},
        {.what = "to the last audio tag", .flv = ended, .stream = AUDIO, .to = 1978, .mode = BACK, .reached = 1978},
        {.what = "last time cut short",
         .flv = cut,
         .stream = VIDEO,
         .to = 700,
         .mode = BACK,
         .reached = 800,
         .left = 44},
        {.what = "two missing", .flv = cut, .stream = VIDEO, .to = 500, .mode = BACK, .reached = 800, .left = 27},
        {.what = "two missing, forward", .flv = cut, .stream = VIDEO, .to = 500, .rc = -101, .left = 27},
        {.what = "two missing after it",
         .flv = cut,
         .stream = VIDEO,
         .to = 300,
         .mode = BACK,
         .reached = 200,
         .left = 27},
        {.what = "none", .flv = cut, .stream = VIDEO, .to = 9, .mode = BACK, .site = FILE_INDEX_TAG_CUT, .left = NONE},
        {.what = "none, forward", .flv = cut, .stream = VIDEO, .to = 9, .rc = -101, .left = NONE},
    };
    for (const auto& row : rows)
        for (const uint32_t mode : row.mode == EACH ? std::vector{BACK, AUTO} : std::vector{row.mode}) {
            SCOPED_TRACE(std::to_string(&row - rows) + ": " + row.what);
            FakeHost host(row.flv.bytes);
            Session session(host, {row.open, (row.open & INFO) != 0});
            flvd_ctx_t* const ctx = session.ctx();
            host.set_visible(static_cast<int64_t>(Elements(row.flv.bytes, "times")) + row.left);
            host.fail({HostFn::Read, row.left == NONE ? 1u : 0u, true});
            uint32_t reached = 0;
            int32_t time = 0;
            const int32_t rc = row.stream == TIME ? session.seek(static_cast<int32_t>(row.to), mode, &time)
                                                  : session.frame_seek(row.to, row.stream, mode, &reached);
            EXPECT_EQ(rc, row.site ? At(*row.site).result() : row.rc);
            EXPECT_TRUE(session.recorded(row.site)) << session.error_line();
            EXPECT_EQ(row.stream == TIME ? static_cast<uint32_t>(time) : reached, row.reached);
            fio_file_t* const reader = row.stream == AUDIO ? ctx->audio_reader : ctx->main_reader;
            EXPECT_TRUE(row.at == HERE || __FLV_DMX__fioTell64(reader) == row.at);
        }
}

TEST(Seek, WorksInAGrowingFile)
{
    const Media media(Chain(0, true));
    for (const uint32_t options : {GROWING, GROWING | TWO}) {
        FakeHost host(media.bytes);
        Player player(host, media, {options});
        host.set_visible(media.keys[6].offset + 10); // of the 11 bytes that a seek checks
        player.seek(800, BACK);
        player.deliver(1);
        EXPECT_EQ(player.session.seek(1300, BACK), -1);
        player.deliver(2);
        host.grow(1);
        player.seek(1300, BACK); // to a tag of which only these bytes have been written
        host.fail_from(HostFn::Seek, host.calls(HostFn::Seek) + 1);
        EXPECT_EQ(player.session.frame(VIDEO).rc, -1); // nor go back to its start, so the position is saved
        host.fail_nothing();
        player.seek(0, REL); // a seek that fails or does not move keeps it
        player.seek(9000, FORTH);
        host.grow(ALL);
        player.deliver(ALL);
    }
}

// After a seek that failed and could not go back, the next failing seek goes back to where the first one started, even
// after frames were played, unless a seek succeeded in between.
TEST(Seek, ReturnsToASavedPosition)
{
    const Media media(Chain(0, false));
    for (const bool succeeds : {false, true}) {
        FakeHost host(media.bytes);
        Player player(host, media, {ONE});
        player.deliver(3);
        const size_t first = player.next[0];
        host.fail_from(HostFn::Seek, host.calls(HostFn::Seek) + 1);
        EXPECT_EQ(player.session.seek(1000, BACK), -1);
        host.fail_nothing();
        player.place(__FLV_DMX__fioTell64(player.reader()));
        player.deliver(9);
        if (succeeds) {
            player.seek(800, BACK);
            player.deliver(9);
        }
        const size_t last = player.next[0];
        player.seek(1950, FORTH); // there is no keyframe
        player.next[0] = succeeds ? last : first;
        player.deliver(9);
        player.seek(1950, FORTH); // the saved position was used
        player.deliver(9);
    }
}

// Every step of a scan starts at the same position and may find the same tag again, which must not loop forever.
TEST(Seek, EndsOnAHostWhosePositionStaysTheSame)
{
    constexpr uint64_t many = 20000; // scanning 200 tags takes a few thousand reads
    Tags tags;
    for (uint32_t i = 0; i < 200; ++i)
        tags.push_back({9, 40 * i, Concat({{0x13}, Bytes(49, 0x55)})}); // 65 bytes in all
    const auto before = tags.begin() + 50;
    const Bytes file = Concat({File({tags.begin(), before}, 1).bytes, {0x55}, File({before, tags.end()}, 1).body()});
    for (const int32_t time : {40, 560, 1080})
        for (int64_t stuck_at = 13; stuck_at < static_cast<int64_t>(file.size()); stuck_at += 997) {
            FakeHost host(file);
            Session session(host);
            host.on_tell = [stuck_at](int64_t) { return stuck_at; };
            host.fail_from(HostFn::Read, many); // ends it
            session.seek(time, BACK);
            EXPECT_LT(host.calls(HostFn::Read), many) << time << " ms, position " << stuck_at;
        }
}

TEST(Seek, BeyondFourGiB)
{
    // Pictures of 12 MiB, one per second and every third a keyframe, each followed by a little audio.
    constexpr uint32_t PICTURE = 12u << 20, SECONDS = 360;
    constexpr int64_t SECOND = PICTURE + 36;
    int64_t head = 0;
    const auto begin = [&head] {
        return IndexedFile({g_avc, g_aac}, [&head](auto& times, auto& positions) {
            for (uint32_t i = 0; i < SECONDS; i += 3) {
                times.push_back(i);
                positions.push_back(static_cast<double>(head + i * SECOND));
            }
        });
    };
    head = begin().size();
    std::map<int64_t, Bytes> extents;
    for (uint32_t i = 0; i < SECONDS; ++i) {
        const Tag picture = {9, i * 1000, AvcNalu(i % 3 == 0, {7}), PICTURE + 11, PICTURE};
        const Bytes both = File({picture, {8, i * 1000 + 10, AacRaw({1, 2, 3, 4})}}).bytes;
        const int64_t position = head + i * SECOND; // the end of the frame is a hole
        extents[position] = Bytes(both.begin() + 13, both.begin() + 30);
        extents[position + 11 + PICTURE] = Bytes(both.begin() + 30, both.end());
    }
    for (const uint32_t options : {INFO, ONE, INDEX, GROWING}) { // the first without index
        SCOPED_TRACE(options);
        extents[0] = (options == INFO ? WithoutIndex(begin()) : begin()).bytes;
        FakeHost host;
        host.add_sparse_file(FakeHost::DEFAULT_FILE, head + SECONDS * SECOND, extents);
        Session session(host, {options & ~INFO});
        for (const auto& [time, mode, expected] :
             {std::tuple(340100, FORTH, 342000), {358000, BACK, 357000}, {10100, FORTH, 12000}}) {
            int32_t reached = UNTOUCHED;
            EXPECT_EQ(session.seek(time, mode, &reached), 0);
            EXPECT_EQ(reached, expected);
            EXPECT_EQ(session.frame().frame.timestamp, static_cast<uint32_t>(reached));
            EXPECT_EQ(session.frame().frame, (Frame{AUDIO, static_cast<uint32_t>(reached) + 10, {1, 2, 3, 4}}));
        }
    }
}

} // namespace
