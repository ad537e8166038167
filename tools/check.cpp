// `flvdmx check`: finds faults in files.
#include <algorithm>
#include <atomic>
#include <filesystem>
#include <functional>
#include <future>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <system_error>
#include <utility>
#include <vector>

#include <fmt/core.h>

#include "tools/chain.h"
#include "tools/commands.h"
#include "tools/input.h"
#include "tools/progress.h"
#include "tools/report.h"

namespace tool {

namespace {

namespace fs = std::filesystem;

constexpr double MS_PER_SECOND = 1000;

// A file between its opening and its result.
struct Subject {
    std::string name;
    std::optional<Input> input{};
    Findings findings{};
    std::optional<FileError> error{}; // why it could not be opened
};

// A file that cannot be played may still open as a growing file, which has fewer requirements. Then its tags can be
// checked.
Subject Open(const std::string& name)
{
    Subject subject{name};
    try {
        subject.input.emplace(name);
    } catch (const FileError& error) {
        try {
            flvdmx::Options options;
            options.growing = true;
            subject.input.emplace(name, options);
            subject.findings.Add("not_playable", "", 0, error.what());
        } catch (const FileError&) {
            subject.error = error;
        }
    }
    return subject;
}

Json CheckTags(Subject& subject, const CheckOptions& options, const TagReader::Progress& progress)
{
    const Input input = std::move(*std::exchange(subject.input, std::nullopt)); // closed on return
    Findings& findings = subject.findings;
    Played played(input, progress);
    Limits limits{static_cast<int64_t>(options.jumpSeconds * MS_PER_SECOND)};
    if (options.maxGapSeconds)
        limits.maxGapMs = static_cast<int64_t>(*options.maxGapSeconds * MS_PER_SECOND);
    Chain chain(played, limits, findings);
    chain.Walk();
    CheckIndex(input, played.Reader(), findings);
    if (const std::string fault = ConfigFault(input); !fault.empty())
        findings.Add("no_configuration", "", input.Instance().data_offset, fault);
    if (const std::string note = UndefinedCodec(input); !note.empty())
        findings.Note("codec", "", input.Instance().data_offset, note);
    if (input.Instance().file_shorter_than_meta != 0)
        findings.Add("cut_short", "", played.Reader().FileSize(), "the metadata announces a larger file");
    Json object = {{"file", input.name},
                   {"size", played.Reader().FileSize()},
                   {"tags", chain.Tags()},
                   {"duration_ms", input.info.duration.count()}};
    findings.WriteTo(object, played.BytesSkipped());
    return object;
}

Json Check(Subject& subject, const CheckOptions& options, const TagReader::Progress& progress)
{
    try {
        if (!subject.error)
            return CheckTags(subject, options, progress);
    } catch (const FileError& error) {
        subject.error = error;
    }
    return {{"file", subject.name}, {"sound", false}, {"error", subject.error->Object()}};
}

std::string CountsText(const Json& counts)
{
    std::string text;
    for (const auto& [kind, count] : counts.items())
        text += fmt::format("{}{} {}", text.empty() ? "" : ", ", count.get<uint64_t>(), kind);
    return text;
}

std::string LineText(const Json& finding, const char* prefix = "")
{
    const auto count = finding["count"].get<uint64_t>();
    const std::string more =
        count > 1 ? fmt::format("; {} of these, the last at byte {}", count, finding["last_offset"].get<int64_t>())
                  : "";
    return fmt::format("  byte {:<12} {:<17}  {}{}{}\n", finding["offset"].get<int64_t>(),
                       finding["kind"].get<std::string>(), prefix, finding["text"].get<std::string>(), more);
}

std::string Text(const std::string& file, const Json& result)
{
    const Json& findings = result["findings"];
    const auto lost = result["lost_bytes"].get<int64_t>();
    std::string text = fmt::format("{}: {}; {}, {} bytes, {}\n", DisplayName(file),
                                   findings.empty() ? "ok" : CountsText(result["counts"]),
                                   Plural(result["tags"].get<uint64_t>(), "tag"), result["size"].get<int64_t>(),
                                   lost == 0 ? "all playable" : fmt::format("{} of them not playable", lost));
    for (const Json& finding : findings)
        text += LineText(finding);
    if (const auto unlisted = result["unlisted"].get<uint64_t>(); unlisted > 0)
        text += fmt::format("  and {} more\n", unlisted);
    for (const Json& note : result["notes"])
        text += LineText(note, "note: ");
    return text;
}

// Prints each result as soon as it is available, or collects them for the JSON document.
class Results {
public:
    explicit Results(const CheckOptions& options) : m_options(options) {}

    void Take(const Subject& subject, Json result)
    {
        if (subject.error)
            Complain(*subject.error);
        else if (!m_options.json)
            Print(Text(subject.name, result));
        m_allOk = m_allOk && result["sound"].get<bool>();
        if (m_options.json)
            m_documents.push_back(std::move(result));
    }

    void Fail() { m_allOk = false; }

    int Finish()
    {
        if (m_options.json)
            PrintJson({{"files", std::move(m_documents)}}, 2);
        return m_allOk ? DONE : FAILED;
    }

private:
    const CheckOptions& m_options;
    Json m_documents = Json::array();
    bool m_allOk = true;
};

using TakeResult = std::function<void(const Subject& subject, Json result)>;

// Checks open files on several threads and passes on the results in order. An exception, for instance because the
// output pipe was closed, soon stops the threads.
void CheckOpened(std::vector<Subject> subjects, const CheckOptions& options, const TagReader::Progress& progress,
                 const TakeResult& take)
{
    std::atomic<bool> stopped = false;
    const auto show = [&](int64_t position) {
        if (stopped)
            throw std::runtime_error("stopped");
        if (progress)
            progress(position);
    };
    std::vector<std::packaged_task<Json()>> tasks;
    tasks.reserve(subjects.size());
    for (Subject& subject : subjects)
        tasks.emplace_back([&] { return Check(subject, options, show); });
    std::atomic<size_t> next = 0;
    const auto work = [&] {
        for (size_t task = 0; !stopped && (task = next++) < tasks.size();)
            tasks[task]();
    };
    std::vector<std::future<void>> crew; // when destroyed, they wait
    const auto stop = [](std::atomic<bool>* flag) { *flag = true; };
    const std::unique_ptr<std::atomic<bool>, decltype(stop)> stopper(&stopped, stop);
    try {
        while (crew.size() < std::min<size_t>(options.jobs, tasks.size()))
            crew.push_back(std::async(std::launch::async, work));
    } catch (const std::system_error&) { // no more threads
        if (crew.empty())
            work();
    }
    for (size_t i = 0; i < tasks.size(); ++i)
        take(subjects[i], tasks[i].get_future().get());
}

// Opens a few files at a time, since no open may run at the same time as other calls.
void CheckAll(const std::vector<std::string>& files, const CheckOptions& options, Results& results)
{
    constexpr size_t OPEN_FILES = 64;
    const bool single = files.size() == 1;
    std::error_code unknown;
    const uint64_t total = single ? fs::file_size(files[0], unknown) : files.size();
    ProgressBar bar(single ? files[0] : "files", static_cast<int64_t>(total));
    TagReader::Progress progress;
    if (single)
        progress = [&bar](int64_t position) { bar.ShowDone(position); };
    int64_t done = 0;
    const auto take = [&](const Subject& subject, Json result) {
        bar.Wipe();
        results.Take(subject, std::move(result));
        if (!single)
            bar.ShowDone(++done);
    };
    const size_t most = std::max<size_t>(options.jobs, OPEN_FILES);
    for (size_t begin = 0; begin < files.size(); begin += most) {
        std::vector<Subject> subjects;
        for (size_t i = begin; i < std::min(begin + most, files.size()); ++i)
            subjects.push_back(Open(files[i]));
        CheckOpened(std::move(subjects), options, progress, take);
    }
}

// The files in a folder and its subfolders that are FLV by their first bytes or their name.
std::vector<std::string> FilesIn(const std::string& folder)
{
    std::vector<std::string> files;
    uint64_t others = 0;
    std::error_code failure;
    for (fs::recursive_directory_iterator entry(folder, fs::directory_options::skip_permission_denied, failure), end;
         !failure && entry != end; entry.increment(failure)) {
        std::error_code unknown;
        if (!entry->is_regular_file(unknown))
            continue;
        if (entry->path().extension() == ".flv" || HasSignature(entry->path()))
            files.push_back(entry->path());
        else
            ++others;
    }
    if (failure)
        throw FileError(folder, fmt::format("cannot be read: {}", failure.message()));
    if (files.empty())
        throw FileError(folder, "this folder contains no FLV file");
    if (others > 0)
        Complain(folder,
                 fmt::format("note: skipped {} that {} not FLV", Plural(others, "file"), others == 1 ? "is" : "are"));
    std::sort(files.begin(), files.end());
    return files;
}

} // namespace

int RunCheck(const CheckOptions& options)
{
    Results results(options);
    std::vector<std::string> files;
    for (const std::string& name : options.files) {
        std::error_code failure;
        if (!fs::is_directory(name, failure)) {
            files.push_back(name);
            continue;
        }
        try {
            const std::vector<std::string> found = FilesIn(name);
            files.insert(files.end(), found.begin(), found.end());
        } catch (const FileError& error) {
            Complain(error);
            results.Fail();
        }
    }
    CheckAll(files, options, results);
    return results.Finish();
}

} // namespace tool
