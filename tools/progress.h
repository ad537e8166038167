// A line of progress on standard error, erased at the end.
#ifndef FLVDMX_TOOLS_PROGRESS_H
#define FLVDMX_TOOLS_PROGRESS_H

#include <chrono>
#include <cstdint>
#include <string>

namespace tool {

/** Updates a line a few times per second, if standard error is a terminal and other output is not disturbed. */
class Progress {
public:
    /** For commands that print frames: active only if standard error is a terminal and standard output is not. */
    Progress();
    ~Progress();
    Progress(const Progress&) = delete;
    Progress& operator=(const Progress&) = delete;

    /** Shows the number of frames and the time reached. */
    void Show(uint64_t frames, int64_t timeMs);

    /** Erases the line to make room for other output. */
    void Wipe();

protected:
    using Clock = std::chrono::steady_clock;

    Progress(bool visible, Clock::duration delay) : m_visible(visible), m_next(Clock::now() + delay) {}
    void Postpone(Clock::duration delay) { m_next = Clock::now() + delay; }
    bool IsDue() const { return m_visible && Clock::now() >= m_next; }
    void ShowLine(const std::string& name, const std::string& text); /**< the name is shortened to fit the terminal */

private:
    const bool m_visible;
    bool m_shown = false;
    Clock::time_point m_next;
};

/** A bar for work that prints nothing until its end; it appears after a second. */
class ProgressBar : public Progress {
public:
    /** @param name what is being processed
     *  @param total amount of work, such as bytes */
    ProgressBar(const std::string& name, int64_t total);

    void ShowDone(int64_t done);

private:
    const std::string m_name;
    const int64_t m_total;
};

/** A bar that follows the position at which the library reads, also during a long search. Only one may exist at a time,
 *  and no other thread may read. */
class ReadProgress : public ProgressBar {
public:
    /** @param passes how often the file will be read */
    ReadProgress(const std::string& name, int64_t size, int passes = 1);
    ~ReadProgress();
    ReadProgress(const ReadProgress&) = delete;
    ReadProgress& operator=(const ReadProgress&) = delete;

    void NextPass() { m_pass += m_size; }

    /** Makes room for output; the bar reappears if there is no output for a second. */
    void Hide();

    /** Shows that the file is being read at this position. */
    static void ShowRead(int64_t position);

private:
    const int64_t m_size;
    int64_t m_pass = 0; // bytes of the previous passes
};

} // namespace tool

#endif
