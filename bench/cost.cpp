// Counts the host calls and bytes of every operation and, for the worst-case files, measures the processor time as
// well. Usage: flvdmx-cost FOLDER. Prints one JSON document.

#include "flvdmx_player.h"
#include "hosts.h"

#include <nlohmann/json.hpp>

#include <algorithm>
#include <cstdio>
#include <ctime>
#include <exception>
#include <filesystem>
#include <string>

using namespace flvd_bench;
using nlohmann::json;

namespace {

constexpr uint32_t MOST_FRAMES = 2'000'000;     // more than any medium has
constexpr uintmax_t WORST_FILE_SIZE = 8u << 20; // only the worst-case files are smaller

double ProcessorSeconds()
{
    timespec now{};
    clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &now);
    return static_cast<double>(now.tv_sec) + 1e-9 * static_cast<double>(now.tv_nsec);
}

/** Cost of one operation, or the largest cost of several. */
struct Price {
    HostCost cost;
    uint64_t calls = 0, bytes = 0;
    double seconds = 0;

    void raise(const HostCost& other, double other_seconds)
    {
        cost = other;
        calls = std::max(calls, other.file_calls());
        bytes = std::max(bytes, other.bytes);
        seconds = std::max(seconds, other_seconds);
    }
    json text() const
    {
        return {{"calls", calls},
                {"bytes", bytes},
                {"seconds", seconds},
                {"reads", cost.of(HostFn::Read)},
                {"seeks", cost.of(HostFn::Seek)},
                {"tells", cost.of(HostFn::Tell)},
                {"eofs", cost.of(HostFn::Eof)},
                {"held", cost.held}};
    }
};

class Meter {
public:
    explicit Meter(const HostKind& host, uint32_t options = 0)
        : m_watch(MakeHost(host, options)), m_player(m_watch.init())
    {
    }

    FlvdmxPlayer& player() { return m_player; }

    template <class Work> void measure(Price& price, const Work& work)
    {
        m_watch.take_cost();
        const double begin = ProcessorSeconds();
        work();
        const double seconds = ProcessorSeconds() - begin;
        price.raise(m_watch.take_cost(), seconds);
    }

private:
    HostWatch m_watch;
    FlvdmxPlayer m_player;
};

/** The cost of each frame request while playing; continues after a request that ends inside the file. */
Price MeasureRequests(Meter& meter)
{
    Price request;
    flvd_frame_t frame{};
    const flvd_ctx_t& instance = meter.player().instance();
    int64_t reached = -1;
    for (uint32_t i = 0; i < MOST_FRAMES; ++i) {
        bool delivered = false;
        meter.measure(request, [&] { delivered = meter.player().frame(frame); });
        const int64_t position = __FLV_DMX__fioTell64(instance.main_reader);
        if (!delivered && (position <= reached || position >= instance.data_end))
            break;
        reached = position;
    }
    return request;
}

/** The cost of a worst-case file with the fewest system calls, which would otherwise dominate its time. */
json MeasureOnPosix(const std::string& path)
{
    Meter meter(g_hosts[1]);
    Price open;
    meter.measure(open, [&] { meter.player().open(path); });
    return {{"open", open.text()}, {"request", MeasureRequests(meter).text()}};
}

/** All operations on one file: opening, each frame, all frames, seeks; the first seek uses a fresh instance. */
json Measure(const std::string& path, uint32_t options)
{
    Meter meter(g_hosts[0], options);
    Price open, play, request, seek, first_seek;
    bool opened = false;
    meter.measure(open, [&] { opened = meter.player().open(path); });
    if (!opened)
        return {{"open", open.text()}, {"opened", false}};
    const uint32_t duration = meter.player().instance().duration_ms;
    const auto time = static_cast<int32_t>(uint64_t{duration} * 6 / 10) + 7;
    meter.measure(first_seek, [&] { meter.player().seek(time); });
    meter.player().open(path);
    Tally tally;
    meter.measure(play, [&] { tally = meter.player().play(); });
    if (std::filesystem::file_size(path) < WORST_FILE_SIZE) {
        meter.player().open(path);
        request = MeasureRequests(meter);
        for (const uint32_t mode : {uint32_t{FLVD_SEEK_FORWARD}, uint32_t{FLVD_SEEK_BACKWARD}})
            for (const int32_t to : {100, 700, time, 0x10000000})
                meter.measure(seek, [&] { meter.player().seek_only(to, mode); });
    }
    return {{"opened", true},
            {"size", std::filesystem::file_size(path)},
            {"frames", tally.frames},
            {"payload", tally.bytes},
            {"open", open.text()},
            {"play", play.text()},
            {"request", request.text()},
            {"seek", seek.text()},
            {"first_seek", first_seek.text()}};
}

json MeasureAll(const std::string& folder)
{
    json all;
    for (const auto& entry : std::filesystem::directory_iterator(folder)) {
        if (entry.path().extension() != ".flv")
            continue;
        const std::string name = entry.path().stem();
        all[name] = Measure(entry.path(), 0);
        if (entry.file_size() < WORST_FILE_SIZE)
            all[name]["posix"] = MeasureOnPosix(entry.path());
        if (name == "hd_index")
            all["hd_index_memory"] = Measure(entry.path(), FLVD_OPT_INDEX_IN_MEMORY);
    }
    return all;
}

} // namespace

int main(int argc, char** argv)
{
    if (argc != 2)
        return 2;
    try {
        std::puts(MeasureAll(argv[1]).dump(1).c_str());
    } catch (const std::exception& error) {
        std::fputs(error.what(), stderr);
        return 1;
    }
    return 0;
}
