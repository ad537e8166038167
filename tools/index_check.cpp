// Compares the keyframe index with the file. It is read in place, so a long one takes no memory.
#include "tools/chain.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <optional>
#include <string>

#include <fmt/core.h>

#include "tools/text.h"

namespace tool {

namespace {

constexpr uint32_t COUNT_SIZE = 4; // AMF0 strict array: the count is before the elements
constexpr uint32_t NUMBER_SIZE = 9;
constexpr uint8_t NUMBER_MARKER = 0;
constexpr double MOST_DIFFERENCE_MS = 1000;

uint32_t CountAt(TagReader& reader, int64_t elements)
{
    const uint8_t* const bytes = reader.Bytes(elements - COUNT_SIZE, COUNT_SIZE);
    return bytes == nullptr ? 0 : BigEndian(bytes, COUNT_SIZE);
}

std::optional<double> NumberAt(TagReader& reader, int64_t elements, uint32_t number)
{
    const uint8_t* const bytes = reader.Bytes(elements + int64_t{NUMBER_SIZE} * number, NUMBER_SIZE);
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

// What is wrong with an entry: the cause, which is the same for all entries with that fault, and the text.
struct Fault {
    const char* cause;
    std::string text;
};

std::optional<Fault> FaultOf(TagReader& reader, double seconds, double position)
{
    // Also true for NaN.
    if (!(position >= 0 && position < static_cast<double>(reader.FileSize())))
        return Fault{"outside", fmt::format("points to byte {:.15g}, which is not in the file", position)};
    const std::optional<Tag> tag = reader.At(static_cast<int64_t>(position));
    // The first entry may point to the configuration instead of the first keyframe.
    if (!tag || !(tag->IsKeyframe() || (tag->IsAvc() && tag->IsConfig())))
        return Fault{"position", fmt::format("points to byte {:.15g}, where there is no keyframe", position)};
    if (!(std::abs(seconds * 1000 - tag->timestamp) <= MOST_DIFFERENCE_MS))
        return Fault{"time", fmt::format("states {}, but the keyframe at byte {:.15g} has {}", TimeText(seconds),
                                         position, FormatTime(tag->timestamp))};
    return std::nullopt;
}

} // namespace

void CheckIndex(const Input& input, TagReader& reader, Findings& findings)
{
    const flvd_keyframe_index_t& index = input.Instance().keyframe_index;
    if (index.times_offset == 0 && index.positions_offset == 0)
        return;
    if (index.times_offset == 0 || index.positions_offset == 0) {
        findings.Add("index", "", std::max(index.times_offset, index.positions_offset),
                     fmt::format("the keyframe index has no {}", index.times_offset == 0 ? "times" : "positions"));
        return;
    }
    const uint32_t times = CountAt(reader, index.times_offset);
    const uint32_t positions = CountAt(reader, index.positions_offset);
    if (times != positions)
        findings.Add("index", "", index.positions_offset,
                     fmt::format("the keyframe index has {} times and {} positions", times, positions));
    for (uint32_t i = 0; i < std::min(times, positions); ++i) {
        const int64_t offset = index.positions_offset + int64_t{NUMBER_SIZE} * i;
        const std::optional<double> time = NumberAt(reader, index.times_offset, i);
        const std::optional<double> position = NumberAt(reader, index.positions_offset, i);
        if (!time || !position) { // the array ends before its stated length
            findings.Add("index", "", offset, fmt::format("index entry {} is not a number", i + 1), {{"entry", i + 1}});
            return;
        }
        if (const std::optional<Fault> fault = FaultOf(reader, *time, *position))
            findings.Add("index", fault->cause, offset, fmt::format("index entry {} {}", i + 1, fault->text),
                         {{"entry", i + 1}});
    }
}

} // namespace tool
