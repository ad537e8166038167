// A line of progress on standard error, wiped at its end.
#ifndef FLVDMX_TOOLS_PROGRESS_H
#define FLVDMX_TOOLS_PROGRESS_H

#include <chrono>
#include <cstdint>
#include <string>

namespace tool {

/** Shows a line a few times per second, where it can be seen and disturbs nothing. */
class Progress {
public:
    /** For a user who has sent standard output elsewhere: needs standard error, and only that, on a terminal. */
    Progress();
    ~Progress();
    Progress(const Progress&) = delete;
    Progress& operator=(const Progress&) = delete;

    /** Shows the number of frames and the time reached. */
    void Show(uint64_t frames, int64_t timeMs);

    /** Makes room for something else on the terminal. */
    void Wipe();

protected:
    using Clock = std::chrono::steady_clock;

    Progress(bool visible, Clock::duration delay) : m_visible(visible), m_next(Clock::now() + delay) {}
    bool IsDue() const { return m_visible && Clock::now() >= m_next; }
    void Postpone(Clock::duration delay);
    void ShowLine(const std::string& name, const std::string& text); /**< the name is shortened to fit the terminal */

private:
    const bool m_visible;
    bool m_shown = false;
    Clock::time_point m_next;
};

/** A bar for work that prints nothing on its way; it appears when the work has taken a second. */
class ProgressBar : public Progress {
public:
    /** @param name what is worked on
     *  @param total amount of work, such as bytes */
    ProgressBar(const std::string& name, int64_t total);

    void ShowDone(int64_t done);

private:
    const std::string m_name;
    const int64_t m_total;
};

/** A bar that follows what the library reads of files, also during one long search. One at a time, and no other thread
 *  may read. */
class ReadProgress : public ProgressBar {
public:
    /** @param passes how often the file will be read */
    ReadProgress(const std::string& name, int64_t size, int passes = 1);
    ~ReadProgress();
    ReadProgress(const ReadProgress&) = delete;
    ReadProgress& operator=(const ReadProgress&) = delete;

    void NextPass() { m_pass += m_size; }

    /** Makes room for output; the bar appears again when nothing has come for a second. */
    void Hide();

    /** Shows that a file is being read at this position. */
    static void ShowRead(int64_t position);

private:
    const int64_t m_size;
    int64_t m_pass = 0; // bytes of the passes before
};

} // namespace tool

#endif
