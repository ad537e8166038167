// `flvdmx seek`: seeks, and shows where the readers landed and the frames that follow.
#include <iterator>
#include <limits>
#include <optional>
#include <vector>

#include <fmt/core.h>

#include "tools/commands.h"
#include "tools/frame_source.h"
#include "tools/input.h"
#include "tools/played.h"
#include "tools/report.h"

namespace tool {

namespace {

using flvdmx::Milliseconds;
using flvdmx::SeekMode;

constexpr size_t MOST_FRAMES_TO_READ = 100;

struct Landing {
    int64_t timeMs;
    int64_t position;
    std::optional<int64_t> audioPosition{}; // only with a separate audio reader
    std::optional<bool> keyframe{};         // only with video
    std::vector<FrameRecord> frames{};
};

bool IsRelative(const SeekOptions& options)
{
    return (options.mode & FLVD_SEEK_RELATIVE) != 0;
}

std::string PositionText(const Input& input, int64_t position)
{
    const char* const place = position == input.Instance().data_offset ? ", the start"
                              : position == input.info.size            ? ", the end"
                                                                       : "";
    return fmt::format("byte {}{}", position, place);
}

// Reads the frames to show, and finds out whether the first video frame among them, or soon after them, is a keyframe.
Landing Look(Input& input, Milliseconds reached, uint64_t count)
{
    const flvd_ctx_t& instance = input.Instance();
    Landing landing{reached.count(), __FLV_DMX__fioTell64(instance.main_reader)};
    if (instance.audio_reader != instance.main_reader)
        landing.audioPosition = __FLV_DMX__fioTell64(instance.audio_reader);
    FrameSource source(input, BOTH_STREAMS);
    const auto needs = [&](size_t looked) {
        const bool picture = input.Has(flvdmx::Stream::video) && !landing.keyframe && looked < MOST_FRAMES_TO_READ;
        return landing.frames.size() < count || picture;
    };
    for (size_t looked = 0; needs(looked); ++looked) {
        const std::optional<FrameRecord> frame = source.Next();
        if (!frame)
            break;
        if (frame->IsVideo() && !landing.keyframe)
            landing.keyframe = frame->keyframe;
        if (landing.frames.size() < count)
            landing.frames.push_back(*frame);
    }
    return landing;
}

const char* DirectionName(uint32_t direction)
{
    switch (direction) {
    case FLVD_SEEK_BACKWARD:
        return "backward";
    case FLVD_SEEK_FORWARD:
        return "forward";
    default:
        return "auto";
    }
}

std::string RequestText(const SeekOptions& options)
{
    return fmt::format("{}{} ({}{})", IsRelative(options) && options.timeMs >= 0 ? "+" : "", FormatTime(options.timeMs),
                       IsRelative(options) ? "relative, " : "", DirectionName(options.direction));
}

Json RequestObject(const SeekOptions& options)
{
    return {{"file", options.file},
            {"time_ms", options.timeMs},
            {"relative", IsRelative(options)},
            {"mode", DirectionName(options.direction)}};
}

void PrintText(const SeekOptions& options, const Input& input, const Landing& landing)
{
    std::string text = fmt::format("sought    {}\nlanded    {}\n", RequestText(options), FormatTime(landing.timeMs));
    const auto out = std::back_inserter(text);
    if (landing.keyframe)
        fmt::format_to(out, "keyframe  {}\n", *landing.keyframe ? "yes" : "no");
    fmt::format_to(out, "position  {}\n", PositionText(input, landing.position));
    if (landing.audioPosition)
        fmt::format_to(out, "audio     {}\n", PositionText(input, *landing.audioPosition));
    if (!landing.frames.empty())
        text += FrameRecord::HEADING;
    for (size_t i = 0; i < landing.frames.size(); ++i)
        text += landing.frames[i].Line(i + 1);
    Print(text);
}

void PrintObject(const SeekOptions& options, const Landing& landing)
{
    Json document = RequestObject(options);
    Json& landed = document["landed"] = {{"time_ms", landing.timeMs}, {"position", landing.position}};
    if (landing.audioPosition)
        landed["audio_position"] = *landing.audioPosition;
    landed["keyframe"] = landing.keyframe ? Json(*landing.keyframe) : Json();
    Json& frames = document["frames"] = Json::array();
    for (size_t i = 0; i < landing.frames.size(); ++i)
        frames.push_back(landing.frames[i].Object(i + 1));
    PrintJson(document, 2);
}

int64_t CurrentTime(const Input& input)
{
    const flvd_ctx_t& instance = input.Instance();
    return input.Has(flvdmx::Stream::video) ? instance.last_video_ts : instance.last_audio_ts;
}

bool SeeksForward(const SeekOptions& options, int64_t target, int64_t current)
{
    if ((options.mode & FLVD_SEEK_RETRY_BACKWARD) != 0)
        return false; // the last attempt
    return options.direction == FLVD_SEEK_FORWARD || (options.direction == 0 && target >= current);
}

// Suggests the mode that would have worked, found by trying it.
std::string Advice(Input& input, int64_t target, bool forward)
{
    const auto other = forward ? SeekMode::backward : SeekMode::forward;
    const auto reached = input.file.seek(Milliseconds(target), other);
    return reached ? fmt::format("; --mode {} lands at {}", forward ? "backward" : "forward", FormatTime(*reached))
                   : "";
}

// Prints a miss of `target`, where `current` was the time before the seek, and returns the error to throw.
FileError Miss(const SeekOptions& options, Input& input, int64_t target, int64_t current, const flvdmx::error& error)
{
    const bool beyond = input.Instance().last_ts != 0 && Milliseconds(target) > input.info.duration;
    const bool forward = SeeksForward(options, target, current);
    const int64_t position = __FLV_DMX__fioTell64(input.Instance().main_reader);
    const std::string reason = beyond ? fmt::format("that is beyond the end at {}", FormatTime(input.info.duration))
                                      : fmt::format("no keyframe is at or {} it{}", forward ? "after" : "before",
                                                    Advice(input, target, forward));
    FileError miss(input.name, fmt::format("seek to {} missed: {}", FormatTime(target), reason), error);
    if (options.json) {
        Json document = RequestObject(options);
        document["landed"] = nullptr;
        document["miss"] = beyond ? "beyond_end" : "no_keyframe";
        document["position"] = position;
        document["error"] = miss.Object();
        PrintJson(document, 2);
    } else {
        Print(fmt::format("sought    {}\nlanded    nowhere\nposition  {}\n", RequestText(options),
                          PositionText(input, position)));
    }
    return miss;
}

// Reads frames and discards them. Of two readers, the one whose last frame is earlier delivers the next one, as in a
// player.
void Play(Input& input, uint64_t frames)
{
    constexpr int64_t ENDED = std::numeric_limits<int64_t>::max();
    int64_t video = input.Has(flvdmx::Stream::video) ? -1 : ENDED;
    int64_t audio = input.Has(flvdmx::Stream::audio) ? -1 : ENDED;
    // With one reader, the stream does not matter.
    while (frames > 0 && (video != ENDED || audio != ENDED)) {
        const bool isVideo = video <= audio;
        const auto frame = NextFrame(input, isVideo ? flvdmx::Stream::video : flvdmx::Stream::audio);
        (isVideo ? video : audio) = frame ? frame->time.count() : ENDED;
        frames -= frame ? 1U : 0U;
    }
}

} // namespace

int RunSeek(const SeekOptions& options)
{
    flvdmx::Options open;
    open.separate_audio_reader = options.separateAudio;
    Input input(options.file, open);
    input.WarnIfCutShort();
    WarnOfUnplayed(input);
    WarnOfRestarts(input);
    Play(input, options.play);
    const int64_t current = CurrentTime(input);
    const auto mode = static_cast<SeekMode>(options.mode | options.direction);
    const auto reached = input.Seek(Milliseconds(options.timeMs), mode);
    if (reached.error().kind() == flvdmx::Kind::miss)
        throw Miss(options, input, options.timeMs + (IsRelative(options) ? current : 0), current, reached.error());
    if (!reached)
        throw FileError(input.name,
                        fmt::format("{}: 'flvdmx frames --from' reads across damage, 'flvdmx repair' removes it",
                                    reached.error().text()),
                        reached.error());
    const Landing landing = Look(input, *reached, options.count);
    if (options.json)
        PrintObject(options, landing);
    else
        PrintText(options, input, landing);
    return DONE;
}

} // namespace tool
