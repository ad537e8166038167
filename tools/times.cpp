// Tells real jumps of timestamps from single wrong ones.
#include "tools/times.h"

#include <algorithm>
#include <cstdlib>
#include <utility>

#include "tools/report.h"

namespace tool {

namespace {

constexpr int64_t JITTER_MS = 1000;
constexpr int64_t LONGEST_STEP_MS = 1000;   // from the frame before an odd one
constexpr int64_t SLOWEST_STEP_MS = 600000; // of a stream that has few frames, such as slides

// The time that is nearest to `near`, as timestamps wrap around at 32 bits.
int64_t Place(int64_t near, int64_t timestamp, int64_t shift)
{
    return near + static_cast<int32_t>(static_cast<uint32_t>(timestamp + shift - near));
}

} // namespace

int64_t Times::Near(int64_t timestamp) const
{
    const int64_t time = Place(m_time, timestamp, m_shift);
    return std::abs(time - m_time) <= m_limit ? time : m_time;
}

bool Times::Fits(const Lane& lane, int64_t timestamp, int64_t shift) const
{
    const int64_t time = Place(lane.placed, timestamp, shift);
    const int64_t reached = shift == m_shift ? std::max(lane.time, m_latest) : lane.time;
    const bool wasAlone = shift == lane.shift && lane.placed - lane.before > JITTER_MS; // the last frame was too late
    return time >= (wasAlone ? lane.before : lane.placed) - JITTER_MS && time >= lane.time - m_limit &&
           time <= reached + lane.limit;
}

// Gives the lane the shift of the other one, or the one tried for an odd frame, if the timestamp fits it.
bool Times::Join(Lane& lane, int64_t timestamp)
{
    if (lane.shift != m_shift && Fits(lane, timestamp, m_shift)) {
        lane.shift = m_shift;
        return true;
    }
    for (const std::optional<int64_t> tried : {lane.tried, m_lanes[0].tried, m_lanes[1].tried}) {
        if (!tried || !Fits(lane, timestamp, *tried))
            continue;
        lane.shift = m_shift = *tried;
        for (Lane& each : m_lanes)
            if (each.tried == tried) {
                each.shift = m_shift;
                each.tried.reset();
            }
        ++m_jumps;
        return true;
    }
    return false;
}

// Two long steps in a row are the rate of a slow stream, not jumps. So is a long step at the start of a file with one
// stream.
bool Times::IsSlow(Lane& lane, int64_t step) const
{
    const auto isLong = [this](int64_t each) { return each > m_limit && each <= SLOWEST_STEP_MS; };
    const bool isAlone = !m_lanes[0].started || !m_lanes[1].started;
    if (isAlone && lane.step == 0 && isLong(step))
        return true;
    if (!lane.tried || !isLong(lane.oddStep) || !isLong(step - lane.oddStep))
        return false;
    lane.limit = SLOWEST_STEP_MS;
    lane.tried.reset();
    return true;
}

Times::Step Times::Classify(Lane& lane, int64_t timestamp)
{
    const int64_t step = Place(lane.placed, timestamp, lane.shift) - lane.placed;
    if (Fits(lane, timestamp, lane.shift)) {
        if (std::exchange(lane.tried, std::nullopt) || step < -JITTER_MS)
            return Step::alone;
        return step < 0 ? Step::back : step > m_limit ? Step::pause : Step::on;
    }
    if (Join(lane, timestamp)) {
        lane.tried.reset();
        return Step::jump;
    }
    if (IsSlow(lane, step))
        return Step::pause;
    int64_t next = lane.time + lane.step;
    for (const Lane& each : m_lanes)
        next = each.started ? std::max(next, each.time + each.step) : next;
    lane.tried = next - timestamp;
    lane.oddStep = step;
    return Step::odd;
}

Times::Step Times::Take(flvdmx::Stream stream, int64_t timestamp)
{
    Lane& lane = m_lanes.at(IndexOf(stream));
    if (!lane.started) {
        const bool first = !m_lanes[0].started && !m_lanes[1].started;
        if (first && timestamp > INT32_MAX) // soon to wrap around: starts at 0 instead
            m_shift = -timestamp;
        const int64_t time = timestamp + m_shift;
        lane = {true, time, time, time, m_limit, 0, m_shift};
    }
    const Step step = Classify(lane, timestamp);
    if (step == Step::odd) {
        lane.time += lane.step;
    } else {
        const int64_t placed = Place(lane.placed, timestamp, lane.shift);
        if (step == Step::on && placed > lane.placed)
            lane.step = std::min(placed - lane.placed, LONGEST_STEP_MS);
        lane.before = std::exchange(lane.placed, placed);
        lane.time = std::max(lane.time, placed);
    }
    m_time = lane.time;
    m_latest = std::max(m_latest, m_time);
    return step;
}

} // namespace tool
