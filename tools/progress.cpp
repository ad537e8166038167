// A line of progress on standard error.
#include "tools/progress.h"

#include <cstdio>

#include <fmt/core.h>
#include <unistd.h>

#include "tools/time_text.h"

namespace tool {

namespace {

constexpr std::chrono::milliseconds INTERVAL{200};
constexpr const char* WIPE_LINE = "\r\033[K";

} // namespace

Progress::Progress() : m_visible(isatty(STDERR_FILENO) != 0 && isatty(STDOUT_FILENO) == 0) {}

Progress::~Progress()
{
    if (m_shown)
        std::fputs(WIPE_LINE, stderr);
}

void Progress::Show(uint64_t frames, int64_t timeMs)
{
    if (!m_visible || Clock::now() < m_next)
        return;
    fmt::print(stderr, "{}{} frames, {}", WIPE_LINE, frames, FormatTime(timeMs));
    m_shown = true;
    m_next = Clock::now() + INTERVAL;
}

} // namespace tool
