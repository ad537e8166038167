// `flvdmx check`: judges files.
#include <algorithm>
#include <functional>
#include <iterator>
#include <memory>
#include <optional>
#include <string>
#include <utility>

#include <fmt/core.h>

#include "tools/chain.h"
#include "tools/commands.h"
#include "tools/demuxer.h"
#include "tools/findings.h"
#include "tools/index_check.h"
#include "tools/progress.h"
#include "tools/report.h"
#include "tools/time_text.h"
#include "tools/workers.h"

namespace tool {

namespace {

// A file that cannot be played may still open as one that is growing, of which less is asked: then there is more to
// say.
std::unique_ptr<Demuxer> Open(const std::string& file, Findings& findings)
{
    try {
        return std::make_unique<Demuxer>(file, 0);
    } catch (const DemuxError& error) {
        try {
            auto demuxer = std::make_unique<Demuxer>(file, FLVD_OPT_PROGRESSIVE);
            findings.Add("not_playable", 0, error.Message());
            return demuxer;
        } catch (const DemuxError&) {
            throw error;
        }
    }
}

Json CheckOpen(const Demuxer& demuxer, Findings& findings, const CheckOptions& options)
{
    constexpr double MILLISECONDS_A_SECOND = 1000;
    const flvd_ctx_t& instance = *demuxer.Instance();
    const TagProbe probe(demuxer);
    std::optional<ProgressBar> bar;
    if (options.jobs == 1) // several bars would be one over the other
        bar.emplace(demuxer.Path(), probe.FileSize());
    Chain chain(demuxer, probe, static_cast<uint32_t>(options.jumpSeconds * MILLISECONDS_A_SECOND), findings,
                [&bar](int64_t position) {
                    if (bar)
                        bar->ShowDone(position);
                });
    chain.Walk();
    CheckIndex(instance.keyframe_index, probe, findings);
    if (instance.file_shorter_than_meta != 0)
        findings.Add("cut_short", probe.FileSize(), "the metadata announces more bytes than the file has");
    Json object = {{"file", demuxer.Path()},
                   {"size", probe.FileSize()},
                   {"tags", chain.Tags()},
                   {"duration_ms", instance.duration_ms}};
    findings.WriteTo(object);
    return object;
}

Json CheckFile(const std::string& file, const CheckOptions& options)
{
    try {
        Findings findings;
        const std::unique_ptr<Demuxer> demuxer = Open(file, findings);
        return CheckOpen(*demuxer, findings, options);
    } catch (const DemuxError& error) {
        return {{"file", file}, {"sound", false}, {"error", ErrorObject(error)}};
    }
}

std::string CountsText(const Json& counts)
{
    std::string text;
    for (const auto& [kind, count] : counts.items())
        text += fmt::format("{}{} {}", text.empty() ? "" : ", ", count.get<uint64_t>(), kind);
    return text;
}

std::string Text(const std::string& file, const Json& result)
{
    const Json& findings = result["findings"];
    std::string text = fmt::format(
        "{}: {}; {} tags, {} bytes, {} of them lost\n", file, findings.empty() ? "sound" : CountsText(result["counts"]),
        result["tags"].get<uint64_t>(), result["size"].get<int64_t>(), result["lost_bytes"].get<int64_t>());
    const auto out = std::back_inserter(text);
    for (const Json& finding : findings)
        fmt::format_to(out, "  byte {:<12} {:<16} {}\n", finding["offset"].get<int64_t>(),
                       finding["kind"].get<std::string>(), finding["text"].get<std::string>());
    if (const auto unlisted = result["unlisted"].get<uint64_t>(); unlisted > 0)
        fmt::format_to(out, "  and {} more\n", unlisted);
    return text;
}

void PrintResult(const std::string& file, const Json& result, const CheckOptions& options)
{
    if (result.contains("error")) {
        const Json& error = result["error"];
        const DemuxError thrown(error["message"], error["code"], error["line"]);
        Complain(file, thrown.Message());
    } else if (!options.json) {
        Print(Text(file, result));
    }
}

// A process that was ended, or ran out of memory, sends nothing.
Json Received(const std::string& file, const std::optional<std::string>& line)
{
    if (line)
        return Json::parse(*line);
    return {{"file", file}, {"sound", false}, {"error", ErrorObject(DemuxError("the process that checked it ended"))}};
}

} // namespace

int RunCheck(const CheckOptions& options)
{
    const size_t count = options.files.size();
    Json results = Json::array();
    int exitCode = DONE;
    const auto take = [&](size_t i, Json result) {
        PrintResult(options.files[i], result, options);
        if (!result["sound"])
            exitCode = FAILED;
        if (options.json)
            results.push_back(std::move(result));
    };
    if (options.jobs == 1) {
        for (size_t i = 0; i < count; ++i)
            take(i, CheckFile(options.files[i], options));
    } else {
        ProgressBar progress("files", static_cast<int64_t>(count));
        const auto work = [&](size_t i) {
            return CheckFile(options.files[i], options).dump(-1, ' ', false, Json::error_handler_t::replace);
        };
        RunWorkers(count, std::min<size_t>(options.jobs, count), work,
                   [&](size_t i, const std::optional<std::string>& line) {
                       progress.Wipe();
                       take(i, Received(options.files[i], line));
                       progress.ShowDone(static_cast<int64_t>(i) + 1);
                   });
    }
    if (options.json)
        PrintJson({{"files", std::move(results)}}, 2);
    return exitCode;
}

} // namespace tool
