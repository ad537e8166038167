// A line of progress on standard error, for a user who has sent standard output elsewhere.
#ifndef FLVDMX_TOOLS_PROGRESS_H
#define FLVDMX_TOOLS_PROGRESS_H

#include <chrono>
#include <cstdint>

namespace tool {

/** Shows nothing unless standard error is a terminal and standard output is none; wipes the line at its end. */
class Progress {
public:
    Progress();
    ~Progress();
    Progress(const Progress&) = delete;
    Progress& operator=(const Progress&) = delete;

    /** Shows the number of frames and the time reached, a few times a second. */
    void Show(uint64_t frames, int64_t timeMs);

private:
    using Clock = std::chrono::steady_clock;

    const bool m_visible;
    bool m_shown = false;
    Clock::time_point m_next = Clock::now();
};

} // namespace tool

#endif
