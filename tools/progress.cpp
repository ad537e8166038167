// A line of progress on standard error.
#include "tools/progress.h"

#include <algorithm>
#include <cmath>
#include <cstdio>

#include <fmt/core.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include "tools/report.h"

namespace tool {

namespace {

constexpr std::chrono::milliseconds INTERVAL{200};
constexpr std::chrono::seconds BAR_DELAY{1};
constexpr int64_t BAR_WIDTH = 30;
constexpr const char* WIPE_LINE = "\r\033[K";

// One column stays free: some terminals wrap the line when the last column is filled.
size_t TerminalColumns()
{
    constexpr size_t UNKNOWN = 80;
    winsize size{};
    const bool known = ioctl(STDERR_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col > 0;
    return (known ? size.ws_col : UNKNOWN) - 1;
}

ReadProgress* g_readProgress = nullptr;

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

void Progress::ShowLine(const std::string& name, const std::string& text)
{
    const size_t columns = TerminalColumns();
    std::fputs((WIPE_LINE + Shorten(name, columns - std::min(columns, text.size())) + text.substr(0, columns)).c_str(),
               stderr);
    std::fflush(stderr);
    m_shown = true;
    Postpone(INTERVAL);
}

void Progress::Show(uint64_t frames, int64_t timeMs)
{
    if (IsDue())
        ShowLine("", fmt::format("{}, {}", Plural(frames, "frame"), FormatTime(timeMs)));
}

ProgressBar::ProgressBar(const std::string& name, int64_t total)
    : Progress(isatty(STDERR_FILENO) != 0, BAR_DELAY), m_name(Printable(name)), m_total(std::max<int64_t>(total, 1))
{
}

void ProgressBar::ShowDone(int64_t done)
{
    if (!IsDue())
        return;
    const auto width = std::min(BAR_WIDTH, static_cast<int64_t>(TerminalColumns()) / 3);
    const double share = std::clamp(static_cast<double>(done) / static_cast<double>(m_total), 0.0, 1.0);
    const std::string bar(static_cast<size_t>(std::lround(share * static_cast<double>(width))), '#');
    ShowLine(m_name, fmt::format(" [{:<{}}] {:3.0f}%", bar, width, share * 100));
}

ReadProgress::ReadProgress(const std::string& name, int64_t size, int passes)
    : ProgressBar(name, size * passes), m_size(size)
{
    g_readProgress = this;
}

ReadProgress::~ReadProgress()
{
    g_readProgress = nullptr;
}

void ReadProgress::Hide()
{
    Wipe();
    Postpone(BAR_DELAY);
}

void ReadProgress::ShowRead(int64_t position)
{
    if (g_readProgress != nullptr)
        g_readProgress->ShowDone(g_readProgress->m_pass + position);
}

} // namespace tool
