// A host that fails: in each scenario, every call that can fail fails once, with and without all later calls, and every
// read is cut short. Every failure is a listed one, all memory and files are released, only frames of the file are
// delivered, and the remaining ones follow after the host has recovered.

#include "support/expected.h"
#include "support/report.h"
#include "support/session.h"
#include "support/sweep.h"

#include <algorithm>
#include <set>

using namespace flvd_test;

namespace {

constexpr int64_t STEP = 601; // bytes by which a file grows
constexpr size_t UNKNOWN = SIZE_MAX;

struct Seek {
    int32_t time;
    uint32_t mode = 0, stream = 0; // with a stream: a frame seek, BACK or FORTH
};

struct Scenario {
    const char* what;
    Flv flv;
    std::vector<OpenOptions> opens; // used in turn
    std::vector<Seek> seeks = {};
    int64_t shown = INT64_MAX; // bytes at first
};

// The nth call fails, or it and all later ones; with `bytes` the nth read is cut short instead.
struct Fault {
    uint64_t nth = 0;
    bool later = false;
    uint32_t bytes = 0;
};

using Seen = std::map<int32_t, std::set<HostFn>>; // line numbers, and the functions whose failure caused them

// One scenario under one fault.
class Course {
public:
    Course(const Scenario& scenario, const OpenOptions& open, const Fault& fault, Seen* seen)
        : m_scenario(scenario), m_fault(fault), m_seen(*seen), m_host(scenario.flv.bytes), m_open(open)
    {
        for (const uint32_t stream : Streams(open.options)) {
            Frames& frames = m_due[stream].first;
            for (const Frame& frame : scenario.flv.frames(stream, 0))
                if ((open.options & USER) == 0 || frame.data.size() <= open.user_buffer_size)
                    frames.push_back(frame);
        }
        m_host.set_visible(scenario.shown);
        m_host.on_call = [this](HostFn fn) { arm(fn); };
        m_host.on_release = [this](const void* block, uint32_t size) {
            if (const auto* const ctx = static_cast<const flvd_ctx_t*>(block); size == sizeof(flvd_ctx_t))
                note(ctx->error, ctx->error_line);
        };
        m_host.fail_nth_call(fault.bytes == 0 ? fault.nth : 0);
        m_host.shorten_nth(HostFn::Read, fault.bytes != 0 ? fault.nth : 0, fault.bytes);
    }
    // Returns the number of calls that can fail, and of reads, before the host recovers.
    std::pair<uint64_t, uint64_t> run()
    {
        Session session(m_host, m_open);
        m_session = &session;
        m_exact = !fired() && !m_open.for_info;
        check(Op::Open, session.open_rc());
        bool on = session.opened();
        const bool rewound = on && fired() && !m_fault.later;
        EXPECT_TRUE(!rewound || __FLV_DMX__fioTell64(session.ctx()->main_reader) == session.ctx()->data_offset);
        take(on ? 3 : 0);
        for (const Seek& seek : m_scenario.seeks)
            on = on && go(seek);
        const std::pair calls(m_host.failable_calls(), m_host.calls(HostFn::Read));
        if (on)
            play_out();
        EXPECT_EQ(session.ctx() != nullptr ? session.close() : 0, 0);
        return calls; // the host reports what was not released
    }

private:
    bool growing() const { return (m_open.options & GROWING) != 0; }
    uint64_t calls() const { return m_fault.bytes != 0 ? m_host.calls(HostFn::Read) : m_host.failable_calls(); }
    bool fired() const { return m_fault.nth != 0 && calls() >= m_fault.nth; }
    // If its position is unknown, reading a growing file continues inside a tag, where a false header may look valid.
    bool strays() const { return growing() && m_by == HostFn::Tell; }
    void arm(HostFn fn)
    {
        if (calls() + 1 == m_fault.nth)
            m_by = m_fault.bytes != 0 ? HostFn::Read : fn;
        m_exact = m_exact && !strays();
        if (m_fault.later && fired())
            m_host.fail_from(fn, 1);
    }
    void note(int32_t code, int32_t line)
    {
        const auto records = [&](const FailureSite& site) { return site.records(code, line); };
        EXPECT_TRUE(line == 0 || std::any_of(FailureSites().begin(), FailureSites().end(), records))
            << code << " / " << line;
        m_seen[line].insert(m_by);
    }
    // After every operation: a failure must be a listed one, and the host must hold exactly what the instance refers
    // to.
    void check(Op op, int32_t rc)
    {
        const int32_t code = m_session->last_error(), line = m_session->error_line();
        const bool miss = op == Op::FrameSeek && (rc == FLVD_ERR_END_OF_DATA || line == 0);
        EXPECT_TRUE(rc == 0 || miss || IsListed(op, rc, code, line)) << rc << ", " << code << " / " << line;
        note(code, line);
        EXPECT_EQ(m_session->ctx() != nullptr, m_session->opened());
        if (!m_session->opened())
            return;
        const flvd_ctx_t& ctx = *m_session->ctx();
        const auto& [video, audio, arrays] = std::tie(ctx.video_info, ctx.audio_info, ctx.keyframe_arrays);
        std::vector<std::pair<const void*, size_t>> blocks = {
            {&ctx, sizeof(ctx)},
            {ctx.frame_buffer, ctx.frame_buffer_size},
            {video.config, video.config_size},
            {audio.config, audio.config_size},
            {arrays.times_ms, arrays.times_count * sizeof(uint32_t)},
            {arrays.positions, arrays.positions_count * sizeof(int64_t)}};
        for (const fio_file_t* const reader : std::set<fio_file_t*>{ctx.main_reader, ctx.audio_reader}) {
            blocks.insert(blocks.end(), {{reader, sizeof(*reader)}, {reader->cache, ctx.cache_size}});
            EXPECT_LE(uint64_t{reader->head} + reader->count, reader->capacity);
            EXPECT_EQ(reader->read_size, reader->capacity);
        }
        if ((ctx.options & USER) != 0)
            blocks[1] = {}; // the host's own
        for (const auto& [block, size] : blocks)
            EXPECT_EQ(m_host.size_of(block), size);
        const auto held = [](const auto& block) { return block.first != nullptr; };
        EXPECT_EQ(static_cast<size_t>(std::count_if(blocks.begin(), blocks.end(), held)), m_host.live_blocks());
        EXPECT_EQ(m_host.open_handles(), ctx.audio_reader != ctx.main_reader ? 2u : 1u);
    }
    // One request. It must deliver a frame of the file: the next one, unless the fault occurred during the request.
    int32_t frame(uint32_t stream)
    {
        const bool before = fired();
        const auto [rc, got] = m_session->frame(stream);
        check(Op::Frame, rc);
        auto& [frames, next] = m_due.at(stream);
        if (before != fired() && !(growing() && rc != 0))
            next = UNKNOWN;
        if (rc != 0)
            return rc;
        const Frame tag{got.stream, got.timestamp + m_session->ctx()->first_ts, got.data};
        const auto index = static_cast<size_t>(std::find(frames.begin(), frames.end(), tag) - frames.begin());
        EXPECT_TRUE(strays() || index < frames.size()) << "at " << got.timestamp;
        EXPECT_TRUE(!m_exact || m_fault.later || next == UNKNOWN || next == index) << index << " for " << next;
        next = index + 1;
        return 0;
    }
    // Requests frames of each stream; a growing file grows when it has no more.
    void take(uint32_t requests)
    {
        for (const auto& [stream, due] : m_due)
            for (uint32_t i = 0; i < requests; ++i)
                if (frame(stream) == FLVD_RET_END)
                    m_host.grow(STEP);
    }
    // Returns false if the reader may now be anywhere.
    bool go(const Seek& seek)
    {
        flvd_ctx_t& ctx = *m_session->ctx();
        const bool before = fired();
        if (seek.stream != 0) {
            uint32_t result = 0;
            check(Op::FrameSeek,
                  m_session->frame_seek(static_cast<uint32_t>(seek.time), seek.stream, seek.mode, &result));
            return false;
        }
        int32_t reached = -1;
        const int32_t rc = m_session->seek(seek.time, seek.mode, &reached);
        check(Op::Seek, rc);
        EXPECT_TRUE(rc == 0 ? reached >= 0 && reached < 1000 : reached == -1);
        EXPECT_TRUE(rc == 0 || rc == -2 || fired() != before || m_fault.later || !m_exact);
        const bool waits = ctx.saved_main_pos != 0 || ctx.saved_audio_pos != 0; // going back failed as well
        EXPECT_TRUE(!waits || growing() || m_fault.later || rc == -2);
        if (rc == 0 || waits || m_fault.later || (seek.mode & AT_END) != 0)
            for (auto& [stream, due] : m_due)
                due.second = UNKNOWN;
        take((seek.mode & AT_END) != 0 ? 0 : 2);
        return true;
    }
    // The host works again.
    void play_out()
    {
        m_host.on_call = nullptr;
        m_host.fail_nothing();
        m_host.set_visible(INT64_MAX);
        const flvd_ctx_t& ctx = *m_session->ctx();
        for (const auto& [stream, due] : m_due) {
            size_t failures = 0, requests = 0;
            for (; failures < 3 && requests < 150; ++requests)
                failures = frame(stream) == 0 ? 0 : failures + 1;
            EXPECT_EQ(failures, 3u);
            const int64_t stopped = __FLV_DMX__fioTell64(stream == AUDIO ? ctx.audio_reader : ctx.main_reader);
            const bool reads = ctx.opened_for_info == 0 && (stream & ctx.streams) != 0;
            const bool ends = reads && !m_fault.later && !strays();
            const auto& [frames, next] = due;
            EXPECT_TRUE(!ends || !m_exact || next == UNKNOWN || next == frames.size()) << next;
            EXPECT_TRUE(!ends || stopped >= m_scenario.flv.tags.back().offset) << stopped;
        }
    }
    const Scenario& m_scenario;
    const Fault m_fault;
    Seen& m_seen;
    FakeHost m_host;
    const OpenOptions m_open;
    // For each requested stream: all frames of the file with the times of their tags, and the index of the next one.
    std::map<uint32_t, std::pair<Frames, size_t>> m_due;
    Session* m_session = nullptr;
    HostFn m_by = HostFn::Count; // the function that failed
    bool m_exact = true;
};

// A file cut short, or with bytes after its end.
Flv Cut(Flv flv, int64_t size)
{
    flv.bytes.resize(static_cast<size_t>(size), 0xEE);
    while (flv.tags.back().end() > size)
        flv.tags.pop_back();
    return flv;
}

std::vector<Scenario> Scenarios()
{
    const auto open = [](uint32_t options, uint32_t cache = 0, bool info = false, uint32_t room = 8192) {
        return OpenOptions{options | USER, info, cache, 0, FakeHost::DEFAULT_FILE, room};
    };
    const auto large = [](const Tag& config, const auto& frame, size_t size) {
        return File({g_meta, config, frame(0, size), frame(40, size), frame(80, 60), frame(120, 60), frame(160, 60)});
    };
    const auto mp3 = [](uint32_t ts) { return Tag{8, ts, AudioData(SOUND_MP3, Concat({Mp3Frame(), Noise(LARGE)}))}; };
    const std::vector<Seek> seeks = {{500, BACK}, {500, FORTH}, {-200, REL},   {790, FORTH | RETRY},
                                     {9000},      {-1},         {9000, AT_END}};
    const std::vector<Seek> near = {{500, BACK}, {300, FORTH}, {-1}}, to_start = {{0, BACK, VIDEO}},
                            back = {{500, BACK, VIDEO}};
    const Flv chain = MakeChain(), indexed = MakeChain({true, true, true, true}), audio = MakeChain({false});
    const Flv avc = large(g_avc, Nalu, LARGE), aac = large(g_aac, Raw, 60);
    const auto is_second = [](const Tag& tag) { return tag.is_keyframe() && tag.timestamp == 200; };
    const int64_t second_key = std::find_if(indexed.tags.begin(), indexed.tags.end(), is_second)->offset;
    Flv damaged = chain, last = File({chain.tags.begin() + 1, chain.tags.end()});
    std::fill_n(&damaged.bytes[static_cast<size_t>(damaged.tags[6].offset)], damaged.tags[6].size(), uint8_t{0xEE});
    damaged.tags.erase(damaged.tags.begin() + 6);
    last.tags.push_back(g_meta);
    const Flv odd_metadata = File({{18, 0, {5, 5}}, g_avc, Nalu(0, 60), Raw(5, 60)});
    const Flv first_large = File({mp3(0), Screen(0, LARGE), mp3(9), Screen(9), Screen(40), Screen(80)});
    const auto plain = [&large](size_t size) { return large(Pcm(0), Pcm, size); };
    const int64_t video = avc.tags[2].end(), aac_frame = aac.tags[2].end();
    const std::vector<OpenOptions> scanning = {open(0), open(SEPARATE, SMALL), open(0, 0, false, 320)},
                                   indexing = {open(0), open(SEPARATE), open(INDEX), {INDEX | SEPARATE}},
                                   growing = {open(GROWING), open(GROWING | SEPARATE)},
                                   information = {open(0, 0, true), open(SEPARATE, 0, true)};
    return {
        {.what = "scan", .flv = chain, .opens = scanning, .seeks = seeks},
        {.what = "audio", .flv = audio, .opens = {open(0)}, .seeks = seeks},
        {.what = "index", .flv = indexed, .opens = indexing, .seeks = seeks},
        {.what = "growing", .flv = indexed, .opens = growing, .seeks = near, .shown = 6000},
        {.what = "growing without index", .flv = chain, .opens = {open(GROWING)}, .shown = 2000},
        {.what = "growing, odd metadata", .flv = odd_metadata, .opens = {open(GROWING)}},
        {.what = "information", .flv = indexed, .opens = information, .seeks = {{500, BACK}}},
        {.what = "metadata at the end", .flv = File(last.tags), .opens = {open(0), open(INDEX)}, .seeks = seeks},
        {.what = "damaged", .flv = damaged, .opens = {open(0), open(SEPARATE)}, .seeks = seeks},
        {.what = "bytes after the last tag", .flv = Cut(indexed, indexed.size() + 50), .opens = {open(0)}},
        {.what = "cut in a keyframe", .flv = Cut(indexed, second_key + 20), .opens = {open(0), open(INDEX)}},
        {.what = "cut after its start", .flv = Cut(indexed, second_key + 900), .opens = {open(INDEX)}},
        {.what = "first tags larger than the cache", .flv = first_large, .opens = {open(0, SMALL)}},
        {.what = "large AVC frames", .flv = avc, .opens = {open(0, SMALL)}},
        {.what = "large AAC frames", .flv = large(g_aac, Raw, LARGE), .opens = {open(0, SMALL)}},
        {.what = "large PCM frames", .flv = plain(LARGE), .opens = {open(0, SMALL), open(GROWING, SMALL)}},
        {.what = "AVC frames above the buffer", .flv = large(g_avc, Nalu, GROWN), .opens = {{}}},
        {.what = "AAC frames above the buffer", .flv = large(g_aac, Raw, GROWN), .opens = {{}}},
        {.what = "PCM frames above the buffer", .flv = plain(GROWN), .opens = {{}}},
        {.what = "growing, ends in a video frame", .flv = avc, .opens = {open(GROWING)}, .shown = video - 5},
        {.what = "growing, ends before its back-pointer", .flv = avc, .opens = {open(GROWING)}, .shown = video - 4},
        {.what = "growing, ends in an audio frame", .flv = aac, .opens = {open(GROWING)}, .shown = aac_frame - 5},
        {.what = "growing, ends in its back-pointer", .flv = aac, .opens = {open(GROWING)}, .shown = aac_frame - 1},
        {.what = "frame seek of audio", .flv = chain, .opens = {open(SEPARATE)}, .seeks = {{500, BACK, AUDIO}}},
        {.what = "frame seek forward", .flv = chain, .opens = {open(0)}, .seeks = {{500, FORTH, VIDEO}}},
        {.what = "frame seek backward", .flv = chain, .opens = {open(0)}, .seeks = back},
        {.what = "frame seek by index", .flv = indexed, .opens = {open(0), open(INDEX)}, .seeks = back},
        {.what = "frame seek to the start", .flv = indexed, .opens = {open(0), open(INDEX)}, .seeks = to_start},
    };
}

// Every call of a scenario fails, alone and with all later ones, and every read is cut short.
void SweepFaults(const Scenario& scenario, const OpenOptions& open, Sweep* sweep, Seen* seen)
{
    const auto run = [&](const Fault& fault) {
        const uint64_t where[] = {open.options, fault.nth, fault.later ? 1u : 0u, fault.bytes};
        SCOPED_TRACE(scenario.what + testing::PrintToString(where)); // options, call, and later, bytes
        return Course(scenario, open, fault, seen).run();
    };
    const auto [calls, reads] = run({});
    for (const bool later : {false, true}) {
        for (uint64_t n = 1; n <= calls; ++n)
            if (sweep->takes_next())
                run({n, later});
        for (uint64_t n = 1; n <= reads; ++n)
            for (const uint32_t bytes : later ? std::array{11u, 12u, 15u} : std::array{1u, 16u, 255u})
                if (sweep->takes_next())
                    run({n, later, bytes});
    }
}

TEST(Faults, AreSurvivedAtEveryCall)
{
    Sweep sweep;
    Seen seen;
    for (const Scenario& scenario : Scenarios())
        for (const OpenOptions& open : scenario.opens)
            SweepFaults(scenario, open, &sweep, &seen);
    if (!Sweep::is_complete())
        return; // a sampled sweep does not reach every site
    const std::map<std::string, HostFn> functions = {{"alloc", HostFn::Alloc},
                                                     {"open", HostFn::Open},
                                                     {"read", HostFn::Read},
                                                     {"seek", HostFn::Seek},
                                                     {"tell", HostFn::Tell}};
    for (const std::vector<std::string>& row : ReadTable("failing_calls.txt")) {
        const auto is_named = [&row](const FailureSite& site) { return site.name == row.at(1); };
        const FailureSite& site = *std::find_if(FailureSites().begin(), FailureSites().end(), is_named);
        EXPECT_TRUE(seen[site.line].contains(functions.at(row[0]))) << row[1];
        EXPECT_TRUE(site.growing_line == 0 || seen[site.growing_line].contains(functions.at(row[0]))) << row[1];
    }
}

} // namespace
