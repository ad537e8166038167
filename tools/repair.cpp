// `flvdmx repair`, `flvdmx index` and `flvdmx cut`: new files from the playable parts of a file.
#include <algorithm>
#include <filesystem>
#include <functional>
#include <optional>
#include <string>
#include <system_error>
#include <vector>

#include <fmt/core.h>

#include "tools/commands.h"
#include "tools/flv_writer.h"
#include "tools/input.h"
#include "tools/output_file.h"
#include "tools/progress.h"
#include "tools/remux.h"
#include "tools/report.h"
#include "tools/scan.h"
#include "tools/tags.h"
#include "tools/text.h"

namespace tool {

namespace {

using Pass = std::function<RemuxReport(const TakeTag& take)>;

// Warns of streams of the file that are not in the new one, and of streams in the new one that players cannot play.
void WarnOfWhatIsNotPlayed(const RewriteOptions& options, const RemuxReport& report)
{
    WarnOfUnplayed(Input(options.file), (report.videoFrames == 0 ? uint32_t{FLVD_STREAM_VIDEO} : 0) |
                                            (report.audioFrames == 0 ? uint32_t{FLVD_STREAM_AUDIO} : 0));
    std::error_code unknown;
    if (options.dryRun || options.out == STANDARD_STREAM || !std::filesystem::is_regular_file(options.out, unknown))
        return;
    const Input result(options.out);
    WarnOfUnplayed(result);
    if (const std::string fault = ConfigFault(result); !fault.empty())
        Complain(options.out, "warning: " + fault);
}

// Runs a pass that measures and, unless it is a dry run, one that writes.
RemuxReport Write(const RewriteOptions& options, int64_t inputSize, const Pass& pass)
{
    std::optional<OutputFile> out; // first of all, so that output that cannot be written fails at once
    if (!options.dryRun)
        out.emplace(options.out, options.file, options.force);
    ReadProgress progress(options.file, inputSize, options.dryRun ? 1 : 2);
    FlvLayout layout;
    const RemuxReport report = pass([&](const NewTag& tag) { layout.Add(tag); });
    if (report.videoFrames + report.audioFrames == 0)
        throw FileError(options.file, "there are no frames to write");
    uint64_t written = 0;
    if (out) {
        const std::vector<uint8_t> beginning = layout.Beginning(MetadataOf(options.file));
        out->Write(beginning.data(), beginning.size());
        progress.NextPass();
        const uint64_t size = beginning.size() + layout.Size();
        pass([&](const NewTag& tag) {
            if (out->Written() < size) // a file that is still being written may have more tags by now
                WriteTag(*out, tag);
        });
        if (out->Written() != size)
            throw FileError(options.file, "the file changed while it was read");
        out->Finish();
        written = out->Written();
    }
    progress.Wipe();
    WarnOfWhatIsNotPlayed(options, report);
    if (options.out == STANDARD_STREAM && !options.dryRun)
        return report;
    Print(fmt::format("{}: {} and {}, {}, {} in the index{}\n", options.dryRun ? "would write" : Printable(options.out),
                      Plural(report.videoFrames, "video frame"), Plural(report.audioFrames, "audio frame"),
                      FormatTime(layout.Duration()), Plural(layout.Keyframes(), "keyframe"),
                      options.dryRun ? "" : fmt::format(", {} bytes", written)));
    return report;
}

// If timestamps jump, a time does not stand for one position; if a stream is not found, neither are its keyframes.
void RefuseUnlessCuttable(const Input& input)
{
    constexpr const char* REMEDY = "use 'flvdmx repair' first";
    if (SeemsToRestart(input))
        throw FileError(input.name, fmt::format("timestamps jump in this file: {}", REMEDY));
    TagReader reader(input);
    for (const flvdmx::Stream stream : {flvdmx::Stream::video, flvdmx::Stream::audio})
        if (!input.Has(stream) && reader.FindConfig(stream))
            throw FileError(input.name, fmt::format("the configuration of the {} is not at the beginning: {}",
                                                    StreamName(stream), REMEDY));
}

// The first pass finds the first timestamp for the second one.
Pass RemuxPass(const std::string& file, RemuxOptions remux)
{
    return [file, remux](const TakeTag& take) mutable {
        const RemuxReport report = Remux(file, remux, take);
        remux.firstTimestamp = report.firstTimestamp;
        return report;
    };
}

// The times at which to cut: those of the keyframes at or before the beginning and at or after the end.
RemuxOptions CutOptions(const RewriteOptions& options)
{
    RemuxOptions remux;
    Input input(options.file);
    RefuseUnlessCuttable(input);
    if (options.fromMs) {
        const auto from = input.file.seek(flvdmx::Milliseconds(*options.fromMs), flvdmx::SeekMode::backward);
        if (!from)
            throw FileError(options.file, from.error());
        remux.fromMs = from->count();
    }
    remux.continuous = !options.keepTimes;
    const int64_t start = input.info.start_time.count();
    remux.offsetMs = options.keepTimes ? start : -std::max<int64_t>(remux.fromMs, 0);
    if (options.toMs) {
        const auto to = input.file.seek(flvdmx::Milliseconds(*options.toMs), flvdmx::SeekMode::forward);
        if (!to && to.error().kind() != flvdmx::Kind::miss) // a miss: no keyframe follows
            throw FileError(options.file, to.error());
        if (to)
            remux.toMs = to->count();
    }
    return remux;
}

} // namespace

int RunRepair(const RewriteOptions& options)
{
    const Input input(options.file);
    RemuxOptions remux;
    remux.allFrames = true;
    remux.continuous = !options.keepTimes;
    remux.offsetMs = input.info.start_time.count();
    const RemuxReport report = Write(options, input.info.size, RemuxPass(options.file, remux));
    if (report.jumps != 0)
        Tell(fmt::format("{}: timestamps made continuous in {}\n", Printable(options.file),
                         Plural(report.jumps, "place")));
    if (report.bytesSkipped != 0)
        Tell(fmt::format("{}: {} skipped\n", Printable(options.file),
                         Plural(static_cast<uint64_t>(report.bytesSkipped), "byte")));
    return DONE;
}

int RunIndex(const RewriteOptions& options)
{
    Write(options, Input(options.file).info.size, [&](const TakeTag& take) { return CopyTags(options.file, take); });
    return DONE;
}

int RunCut(const RewriteOptions& options)
{
    Write(options, Input(options.file).info.size, RemuxPass(options.file, CutOptions(options)));
    return DONE;
}

} // namespace tool
