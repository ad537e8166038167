// The keyframe index against the file. It is read where it lies: a long one takes no memory.
#include "tools/index_check.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <string>

#include <fmt/core.h>

#include "tools/time_text.h"

namespace tool {

namespace {

constexpr uint32_t COUNT_SIZE = 4; // AMF0 strict array: the count stands in front of the elements
constexpr uint32_t NUMBER_SIZE = 9;
constexpr uint8_t NUMBER_MARKER = 0;
constexpr double MOST_DIFFERENCE_MS = 1000;

uint32_t CountAt(const TagProbe& probe, int64_t elements)
{
    const uint8_t* const bytes = probe.Bytes(elements - COUNT_SIZE, COUNT_SIZE);
    return bytes == nullptr ? 0 : BigEndian(bytes, COUNT_SIZE);
}

std::optional<double> NumberAt(const TagProbe& probe, int64_t elements, uint32_t number)
{
    const uint8_t* const bytes = probe.Bytes(elements + int64_t{NUMBER_SIZE} * number, NUMBER_SIZE);
    if (bytes == nullptr || bytes[0] != NUMBER_MARKER)
        return std::nullopt;
    const uint64_t bits = uint64_t{BigEndian(bytes + 1, 4)} << 32 | BigEndian(bytes + 5, 4);
    double value = 0;
    std::memcpy(&value, &bits, sizeof value);
    return value;
}

std::string TimeText(double seconds)
{
    constexpr double MOST_SECONDS = 1e9;
    return std::abs(seconds) < MOST_SECONDS ? FormatTime(std::llround(seconds * 1000)) : fmt::format("{} s", seconds);
}

// @return what is wrong with an entry, or nothing
std::string Judge(const TagProbe& probe, double seconds, double position)
{
    // Also when it is not a number.
    if (!(position >= 0 && position < static_cast<double>(probe.FileSize())))
        return fmt::format("leads to byte {:.15g}, which the file does not have", position);
    const std::optional<Tag> tag = probe.At(static_cast<int64_t>(position));
    // The configuration may stand for the first keyframe.
    if (!tag || !(tag->IsKeyframe() || (tag->IsAvc() && tag->IsConfig())))
        return fmt::format("leads to byte {:.15g}, where no keyframe is", position);
    if (!(std::abs(seconds * 1000 - tag->timestamp) <= MOST_DIFFERENCE_MS))
        return fmt::format("says {}, the keyframe at byte {:.15g} has {}", TimeText(seconds), position,
                           FormatTime(tag->timestamp));
    return {};
}

} // namespace

void CheckIndex(const flvd_keyframe_index_t& index, const TagProbe& probe, Findings& findings)
{
    if (index.times_offset == 0 && index.positions_offset == 0)
        return;
    if (index.times_offset == 0 || index.positions_offset == 0) {
        findings.Add("index", std::max(index.times_offset, index.positions_offset),
                     fmt::format("the keyframe index has no {}", index.times_offset == 0 ? "times" : "positions"));
        return;
    }
    const uint32_t times = CountAt(probe, index.times_offset);
    const uint32_t positions = CountAt(probe, index.positions_offset);
    if (times != positions)
        findings.Add("index", index.positions_offset,
                     fmt::format("the keyframe index has {} times and {} positions", times, positions));
    for (uint32_t i = 0; i < std::min(times, positions); ++i) {
        const int64_t offset = index.positions_offset + int64_t{NUMBER_SIZE} * i;
        const std::optional<double> time = NumberAt(probe, index.times_offset, i);
        const std::optional<double> position = NumberAt(probe, index.positions_offset, i);
        if (!time || !position) { // the array is not as long as it says
            findings.Add("index", offset, fmt::format("index entry {} is not a number", i + 1), {{"entry", i + 1}});
            return;
        }
        if (const std::string fault = Judge(probe, *time, *position); !fault.empty())
            findings.Add("index", offset, fmt::format("index entry {} {}", i + 1, fault), {{"entry", i + 1}});
    }
}

} // namespace tool
