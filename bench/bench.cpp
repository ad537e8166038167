// Times every operation on every medium, player and host. All players of a medium run in succession, so that a round
// compares what ran within the same seconds. Usage: flvdmx-bench FOLDER [Google Benchmark options]

#include "flvdmx_player.h"
#include "hosts.h"

#include <benchmark/benchmark.h>

#include <chrono>
#include <functional>
#include <string>
#include <sys/resource.h>

using namespace flvd_bench;

namespace {

constexpr int PLAYS = 3, LONG_PLAYS = 1, OPENS = 300, SEEKS = 100, SLOW_SEEKS = 2;

using MakePlayer = std::function<PlayerPtr()>;

std::string g_folder;

std::string PathOf(const std::string& medium)
{
    return g_folder + "/" + medium + ".flv";
}

double UserSeconds()
{
    rusage used{};
    getrusage(RUSAGE_SELF, &used);
    return static_cast<double>(used.ru_utime.tv_sec) + 1e-6 * static_cast<double>(used.ru_utime.tv_usec);
}

/** Runs `work` and returns its wall time in seconds; adds its user time to `user`. */
template <class Work> double Timed(double& user, const Work& work)
{
    using Clock = std::chrono::steady_clock;
    const double user_before = UserSeconds();
    const auto begin = Clock::now();
    work();
    const std::chrono::duration<double> taken = Clock::now() - begin;
    user += UserSeconds() - user_before;
    return taken.count();
}

void Play(benchmark::State& state, const std::string& medium, const MakePlayer& make)
{
    const PlayerPtr player = make();
    Tally tally;
    double user = 0;
    if (player->open(PathOf(medium)))
        tally = player->play(); // warms the page cache, which the previous file may have filled
    for (auto _ : state) {
        if (!player->open(PathOf(medium)))
            return state.SkipWithError("cannot open");
        state.SetIterationTime(Timed(user, [&] { tally = player->play(); }));
    }
    state.counters["frames"] = static_cast<double>(tally.frames);
    state.counters["bytes"] = static_cast<double>(tally.bytes);
    state.counters["user"] = user / static_cast<double>(state.iterations());
}

void Open(benchmark::State& state, const std::string& medium, const MakePlayer& make)
{
    const PlayerPtr player = make();
    double user = 0;
    bool opened = true;
    for (auto _ : state) {
        player->close();
        state.SetIterationTime(Timed(user, [&] { opened = player->open(PathOf(medium)) && opened; }));
    }
    if (!opened)
        state.SkipWithError("cannot open");
}

/** A time after the middle of the file that is not a keyframe's. */
int32_t SeekTime(const std::string& medium)
{
    FlvdmxPlayer player(MakeHost(g_hosts[0]));
    if (!player.open(PathOf(medium)))
        return 0;
    return static_cast<int32_t>(uint64_t{player.instance().duration_ms} * 6 / 10) + 7;
}

void Seek(benchmark::State& state, const std::string& medium, const MakePlayer& make)
{
    const PlayerPtr player = make();
    const int32_t time = SeekTime(medium);
    uint32_t size = 0;
    double user = 0;
    for (auto _ : state) {
        if (!player->open(PathOf(medium)))
            return state.SkipWithError("cannot open");
        state.SetIterationTime(Timed(user, [&] { size = player->seek(time); }));
    }
    if (size == 0)
        state.SkipWithError("cannot seek");
    state.counters["bytes"] = size;
}

using Operation = void (*)(benchmark::State&, const std::string&, const MakePlayer&);

void Register(const std::string& name, const std::string& medium, Operation run, int times, const MakePlayer& make)
{
    if (make() == nullptr)
        return;
    benchmark::RegisterBenchmark(name.c_str(), [=](benchmark::State& state) { run(state, medium, make); })
        ->UseManualTime()
        ->Iterations(times);
}

/** The library, on each host. */
void RegisterHosts(const std::string& name, const std::string& medium, Operation run, int times, uint32_t options = 0)
{
    for (const HostKind& kind : g_hosts)
        Register(name + "/flvdmx-" + kind.name, medium, run, times,
                 [=] { return std::make_unique<FlvdmxPlayer>(MakeHost(kind, options)); });
}

void RegisterLibavformat(const std::string& name, const std::string& medium, Operation run, int times,
                         LibavformatOpen how)
{
    Register(name, medium, run, times, [=] { return MakeLibavformatPlayer(how); });
}

void RegisterPlay(const std::string& medium, bool sound, int times)
{
    const std::string name = "play/" + medium;
    RegisterHosts(name, medium, Play, times);
    for (const HostKind& kind : g_hosts)
        Register(name + "/replay-" + kind.name, medium, Play, times, [=] { return MakeReplayPlayer(MakeHost(kind)); });
    RegisterLibavformat(name + "/libavformat", medium, Play, times, LibavformatOpen::Bare);
    if (sound)
        Register(name + "/trusting", medium, Play, times, MakeTrustingPlayer);
}

void RegisterOpen(const std::string& medium)
{
    const std::string name = "open/" + medium;
    RegisterHosts(name, medium, Open, OPENS);
    RegisterLibavformat(name + "/libavformat", medium, Open, OPENS, LibavformatOpen::Bare);
    RegisterLibavformat(name + "/libavformat-info", medium, Open, OPENS, LibavformatOpen::StreamInfo);
}

void RegisterSeek(const std::string& how, const std::string& medium, uint32_t options, int reference_times)
{
    const std::string name = how + "/" + medium;
    RegisterHosts(name, medium, Seek, SEEKS, options);
    RegisterLibavformat(name + "/libavformat", medium, Seek, reference_times, LibavformatOpen::StreamsKnown);
}

void RegisterAll()
{
    for (const char* const medium : {"small", "hd"})
        RegisterPlay(medium, true, PLAYS);
    for (const HostKind& kind : g_hosts)
        Register(std::string("play/small/header-") + kind.name, "small", Play, PLAYS,
                 [=] { return std::make_unique<HeaderPlayer>(MakeHost(kind)); });
    RegisterPlay("long", true, LONG_PLAYS);
    for (const char* const medium : {"damaged", "tail"})
        RegisterPlay(medium, false, PLAYS);
    for (const char* const medium : {"small", "hd", "hd_index", "long"})
        RegisterOpen(medium);
    RegisterSeek("seek_memory", "hd_index", FLVD_OPT_INDEX_IN_MEMORY, SEEKS);
    RegisterSeek("seek_file", "hd_index", 0, SEEKS);
    for (const char* const medium : {"small", "hd"})
        RegisterSeek("seek_scan", medium, 0, SLOW_SEEKS);
}

} // namespace

int main(int argc, char** argv)
{
    benchmark::Initialize(&argc, argv);
    if (argc != 2)
        return 2;
    g_folder = argv[1];
    RegisterAll();
    benchmark::RunSpecifiedBenchmarks();
    return 0;
}
