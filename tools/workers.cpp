// Processes that work side by side.
#include "tools/workers.h"

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstring>
#include <memory>
#include <stdexcept>
#include <vector>

#include <fmt/core.h>
#include <sys/wait.h>
#include <unistd.h>

namespace tool {

namespace {

[[noreturn]] void FailToStart()
{
    throw std::runtime_error(fmt::format("cannot start a process: {}", std::strerror(errno)));
}

// A process that sends lines. It is ended with the object: it would not notice that nobody reads its lines any more,
// because the workers started later hold the reading end too.
class Worker {
public:
    explicit Worker(const std::function<void(std::FILE*)>& run)
    {
        int ends[2];
        std::fflush(nullptr); // or the child would hold a copy of what has not been written yet
        if (pipe(ends) != 0)
            FailToStart();
        m_process = fork();
        if (m_process == 0)
            RunChild(ends, run);
        close(ends[1]);
        m_lines = fdopen(ends[0], "r");
        if (m_process < 0 || m_lines == nullptr)
            FailToStart();
    }
    ~Worker()
    {
        std::fclose(m_lines);
        kill(m_process, SIGTERM);
        waitpid(m_process, nullptr, 0);
    }
    Worker(const Worker&) = delete;
    Worker& operator=(const Worker&) = delete;

    std::optional<std::string> Line()
    {
        std::string line;
        for (int c = std::fgetc(m_lines); c != EOF; c = std::fgetc(m_lines)) {
            if (c == '\n')
                return line;
            line.push_back(static_cast<char>(c));
        }
        return std::nullopt;
    }

private:
    [[noreturn]] static void RunChild(const int (&ends)[2], const std::function<void(std::FILE*)>& run)
    {
        close(ends[0]);
        std::FILE* const lines = fdopen(ends[1], "w");
        try {
            if (lines != nullptr)
                run(lines);
        } catch (const std::exception&) { // the lines that are missing tell
        }
        _exit(0);
    }

    pid_t m_process = -1;
    std::FILE* m_lines = nullptr;
};

} // namespace

// Every worker has a fixed share, so that the order needs no bookkeeping: a worker that is ahead waits in its pipe.
void RunWorkers(size_t count, size_t jobs, const std::function<std::string(size_t)>& work,
                const std::function<void(size_t, const std::optional<std::string>&)>& take)
{
    if (jobs == 0)
        return;
    std::vector<std::unique_ptr<Worker>> workers;
    for (size_t first = 0; first < jobs; ++first)
        workers.push_back(std::make_unique<Worker>([&, first](std::FILE* lines) {
            for (size_t i = first; i < count; i += jobs) {
                fmt::print(lines, "{}\n", work(i));
                if (std::fflush(lines) != 0)
                    return;
            }
        }));
    for (size_t i = 0; i < count; ++i)
        take(i, workers[i % jobs]->Line());
}

} // namespace tool
