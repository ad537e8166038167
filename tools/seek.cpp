// `flvdmx seek`: seeks, shows where the readers landed and the frames from there on.
#include <iterator>
#include <limits>
#include <optional>
#include <utility>

#include <fmt/core.h>

#include "tools/commands.h"
#include "tools/demuxer.h"
#include "tools/frame_source.h"
#include "tools/report.h"
#include "tools/tags.h"
#include "tools/time_text.h"

namespace tool {

namespace {

constexpr int MOST_TAGS_TO_LOOK_AT = 100;

struct Landing {
    int32_t timeMs;
    int64_t position;
    std::optional<int64_t> audioPosition; // only with a reader of its own
    std::optional<bool> keyframe;         // only with video
};

std::optional<Tag> PeekTag(fio_file_t* reader)
{
    const uint8_t* bytes = nullptr;
    const uint32_t available = __FLV_DMX__fioShowBytesByPtr(&bytes, TAG_HEADER_SIZE + 2, reader);
    return available < TAG_HEADER_SIZE ? std::nullopt : std::optional(Tag::Parse(0, bytes, available));
}

// Looks for the next video frame from the reader's position on.
std::optional<bool> NextPictureIsKeyframe(flvd_ctx_t* instance)
{
    fio_file_t* const reader = instance->main_reader;
    for (int i = 0; i < MOST_TAGS_TO_LOOK_AT; ++i) {
        flvd_tag_info_t tag{};
        if (FLVD_GetCurrTagInfo(instance, reader, &tag, FLVD_TAG_VIDEO, 0) != 0)
            return std::nullopt;
        const std::optional<Tag> found = PeekTag(reader);
        if (!found || found->IsFrame())
            return found ? std::optional(found->IsKeyframe()) : std::nullopt;
        __FLV_DMX__fioSkipBytes(TAG_HEADER_SIZE + tag.data_size + BACK_POINTER_SIZE, reader);
    }
    return std::nullopt;
}

std::string PlaceText(const flvd_ctx_t& instance, int64_t position)
{
    const char* const place = position == instance.data_offset ? ", the start"
                              : position == instance.file_size ? ", the end"
                                                               : "";
    return fmt::format("byte {}{}", position, place);
}

Landing DescribeLanding(const Demuxer& demuxer, int32_t timeMs)
{
    Landing landing{timeMs, demuxer.Position(FLVD_STREAM_VIDEO), std::nullopt, std::nullopt};
    if (demuxer.HasSeparateAudio())
        landing.audioPosition = demuxer.Position(FLVD_STREAM_AUDIO);
    if (demuxer.Video() != nullptr) {
        landing.keyframe = NextPictureIsKeyframe(demuxer.Instance());
        __FLV_DMX__fioSeek64(demuxer.Instance()->main_reader, landing.position, FIO_SEEK_SET);
    }
    return landing;
}

const char* DirectionName(uint32_t mode)
{
    switch (mode & FLVD_SEEK_DIRECTION_MASK) {
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
    const bool relative = (options.mode & FLVD_SEEK_RELATIVE) != 0;
    return fmt::format("{}{} ({}{})", relative && options.timeMs >= 0 ? "+" : "", FormatTime(options.timeMs),
                       relative ? "relative, " : "", DirectionName(options.mode));
}

std::string LandingText(const SeekOptions& options, const flvd_ctx_t& instance, const Landing& landing)
{
    std::string text = fmt::format("sought    {}\nlanded    {}\n", RequestText(options), FormatTime(landing.timeMs));
    const auto out = std::back_inserter(text);
    if (landing.keyframe)
        fmt::format_to(out, "keyframe  {}\n", *landing.keyframe ? "yes" : "no");
    fmt::format_to(out, "position  {}\n", PlaceText(instance, landing.position));
    if (landing.audioPosition)
        fmt::format_to(out, "audio     {}\n", PlaceText(instance, *landing.audioPosition));
    return text;
}

Json LandingObject(const Landing& landing)
{
    Json object = {{"time_ms", landing.timeMs}, {"position", landing.position}};
    if (landing.audioPosition)
        object["audio_position"] = *landing.audioPosition;
    object["keyframe"] = landing.keyframe ? Json(*landing.keyframe) : Json();
    return object;
}

Json RequestObject(const SeekOptions& options)
{
    return {{"file", options.file},
            {"time_ms", options.timeMs},
            {"relative", (options.mode & FLVD_SEEK_RELATIVE) != 0},
            {"mode", DirectionName(options.mode)}};
}

void PrintLanding(const SeekOptions& options, Demuxer& demuxer, const Landing& landing)
{
    FrameSource source(demuxer, FLVD_STREAM_VIDEO | FLVD_STREAM_AUDIO);
    Json frames = Json::array();
    if (!options.json)
        Print(LandingText(options, *demuxer.Instance(), landing));
    for (uint64_t number = 1; number <= options.count; ++number) {
        const std::optional<Frame> frame = source.Next();
        if (!frame)
            break;
        if (options.json)
            frames.push_back(FrameObject(number, *frame));
        else
            Print(FrameLine(number, *frame));
    }
    if (!options.json)
        return;
    Json document = RequestObject(options);
    document["landed"] = LandingObject(landing);
    document["frames"] = std::move(frames);
    PrintJson(document, 2);
}

void PrintMiss(const SeekOptions& options, const SeekMiss& miss, const Demuxer& demuxer)
{
    const int64_t position = demuxer.Position(FLVD_STREAM_VIDEO);
    if (options.json) {
        Json document = RequestObject(options);
        document["landed"] = nullptr;
        document["miss"] = miss.BeyondEnd() ? "beyond_end" : "no_keyframe";
        document["position"] = position;
        document["error"] = ErrorObject(miss);
        PrintJson(document, 2);
    } else {
        Print(fmt::format("sought    {}\nlanded    nowhere\nposition  {}\n", RequestText(options),
                          PlaceText(*demuxer.Instance(), position)));
    }
}

// Reads frames and drops them. Of two readers the one whose last frame is earlier is asked, as a player does: no
// reader comes further than the number of frames says.
void Play(Demuxer& demuxer, uint64_t frames)
{
    constexpr int64_t ENDED = std::numeric_limits<int64_t>::max();
    int64_t video = demuxer.Video() != nullptr ? -1 : ENDED;
    int64_t audio = demuxer.Audio() != nullptr ? -1 : ENDED;
    // With one reader it does not matter which stream is asked.
    while (frames > 0 && (video != ENDED || audio != ENDED)) {
        const bool isVideo = video <= audio;
        const std::optional<Frame> frame = demuxer.NextFrame(isVideo ? FLVD_STREAM_VIDEO : FLVD_STREAM_AUDIO);
        (isVideo ? video : audio) = frame ? frame->timeMs : ENDED;
        frames -= frame ? 1U : 0U;
    }
}

int SeekIn(Demuxer& demuxer, const SeekOptions& options)
{
    Play(demuxer, options.play);
    try {
        const int32_t reached = demuxer.Seek(options.timeMs, options.mode);
        PrintLanding(options, demuxer, DescribeLanding(demuxer, reached));
        return DONE;
    } catch (const SeekMiss& miss) {
        PrintMiss(options, miss, demuxer);
        Complain(options.file, miss.Message());
        return FAILED;
    }
}

} // namespace

int RunSeek(const SeekOptions& options)
{
    try {
        Demuxer demuxer(options.file, options.separateAudio ? FLVD_OPT_SEPARATE_AUDIO_READER : 0);
        WarnIfCutShort(demuxer);
        return SeekIn(demuxer, options);
    } catch (const DemuxError& error) {
        Complain(options.file, error.Message());
        return FAILED;
    }
}

} // namespace tool
