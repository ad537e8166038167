// A line of progress on standard error.
#include "tools/progress.h"

#include <algorithm>
#include <cstdio>
#include <utility>

#include <fmt/core.h>
#include <unistd.h>

#include "tools/time_text.h"

namespace tool {

namespace {

constexpr std::chrono::milliseconds INTERVAL{200};
constexpr std::chrono::seconds BAR_DELAY{1};
constexpr int64_t BAR_WIDTH = 30;
constexpr const char* WIPE_LINE = "\r\033[K";

} // namespace

Progress::Progress() : Progress(isatty(STDERR_FILENO) != 0 && isatty(STDOUT_FILENO) == 0, Clock::duration::zero()) {}

Progress::~Progress()
{
    Wipe();
}

void Progress::Wipe()
{
    if (m_shown)
        std::fputs(WIPE_LINE, stderr);
    m_shown = false;
}

void Progress::ShowLine(const std::string& text)
{
    std::fputs((WIPE_LINE + text).c_str(), stderr);
    std::fflush(stderr);
    m_shown = true;
    m_next = Clock::now() + INTERVAL;
}

void Progress::Show(uint64_t frames, int64_t timeMs)
{
    if (IsDue())
        ShowLine(fmt::format("{} frames, {}", frames, FormatTime(timeMs)));
}

ProgressBar::ProgressBar(std::string name, int64_t total)
    : Progress(isatty(STDERR_FILENO) != 0, BAR_DELAY), m_name(std::move(name)), m_total(std::max<int64_t>(total, 1))
{
}

void ProgressBar::ShowDone(int64_t done)
{
    if (!IsDue())
        return;
    const double share = std::clamp(static_cast<double>(done) / static_cast<double>(m_total), 0.0, 1.0);
    const std::string bar(static_cast<size_t>(share * BAR_WIDTH), '#');
    ShowLine(fmt::format("{} [{:<{}}] {:3.0f}%", m_name, bar, BAR_WIDTH, share * 100));
}

} // namespace tool
