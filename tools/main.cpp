// The command line.
#include <algorithm>
#include <csignal>
#include <exception>
#include <filesystem>
#include <map>
#include <memory>
#include <string>
#include <system_error>
#include <utility>
#include <vector>

#include <CLI/CLI.hpp>
#include <fcntl.h>
#include <fmt/core.h>
#include <unistd.h>

#include "tools/commands.h"
#include "tools/report.h"

#ifndef FLVDMX_VERSION
#define FLVDMX_VERSION "unknown version"
#endif

namespace tool {

namespace {

constexpr const char* TIME_HELP = "TIME is a number of seconds (12.5) or [HH:]MM:SS[.FRACTION].";

// Without the blank that protects a dash: see Arguments().
std::string Trimmed(const std::string& text)
{
    return text.size() > 1 && text[0] == ' ' && text[1] == '-' ? text.substr(1) : text;
}

// Validators return what is wrong with a value; an empty text accepts it.
const CLI::Validator IS_TIME(
    [](const std::string& text) {
        return ParseTime(text) ? std::string()
                               : fmt::format("'{}' is not a time: write seconds or [HH:]MM:SS[.FRACTION]", text);
    },
    "", "time");

// A negative time makes sense only where it is an offset.
const CLI::Validator IS_POSITION(
    [](const std::string& text) {
        return ParseTime(text).value_or(0) >= 0 ? "" : fmt::format("'{}' is before the beginning", Trimmed(text));
    },
    "", "position");

// Rejects signs, which the conversion to an unsigned number accepts.
const CLI::Validator IS_COUNT(
    [](const std::string& text) {
        const bool digits = text.find_first_not_of("0123456789") == std::string::npos;
        return digits ? std::string() : fmt::format("'{}' is not a whole number of 0 or more", Trimmed(text));
    },
    "", "count");

constexpr double MOST_SECONDS = 4294967; // as milliseconds, they fit 32 bits

const CLI::Validator IS_SECONDS(
    [](const std::string& text) {
        double seconds = -1;
        const bool valid = CLI::detail::lexical_cast(text, seconds) && seconds >= 0 && seconds <= MOST_SECONDS;
        return valid ? std::string() : fmt::format("'{}' is not a number of seconds", Trimmed(text));
    },
    "", "seconds");

const CLI::Validator IS_NAME([](const std::string& text) { return text.empty() ? "the name is empty" : ""; }, "",
                             "name");

const CLI::Validator TRIM(
    [](std::string& text) {
        text = Trimmed(text);
        return std::string();
    },
    "", "trim");

void AddFile(CLI::App* command, std::string& file)
{
    command->add_option("FILE", file, "FLV file; - is standard input")->required()->transform(TRIM)->type_name("");
}

void AddFiles(CLI::App* command, std::vector<std::string>& files, const char* help)
{
    command->add_option("FILE", files, help)->required()->transform(TRIM)->type_name("");
}

CLI::Option* AddOutput(CLI::App* command, std::string& out, bool& force, const char* help)
{
    CLI::Option* const output =
        command->add_option("-o,--output", out, help)->required()->check(IS_NAME)->transform(TRIM)->type_name("OUT");
    command->add_flag("--force", force, "Overwrite an existing file");
    return output;
}

template <typename Time> CLI::Option* AddTime(CLI::App* command, const char* name, Time& time, const char* help)
{
    const auto parse = [&time](const std::string& text) { time = ParseTime(text).value_or(0); };
    return command->add_option_function<std::string>(name, parse, help)->check(IS_TIME)->type_name("TIME");
}

// The options of commands that work on a part of a file.
template <typename Options> void AddRange(CLI::App* command, Options& options, const char* fromHelp, const char* toHelp)
{
    AddTime(command, "--from", options.fromMs, fromHelp)->check(IS_POSITION);
    AddTime(command, "--to", options.toMs, toHelp)->check(IS_POSITION);
}

template <typename Options> void CheckRange(const Options& options)
{
    if (options.fromMs && options.toMs && *options.fromMs > *options.toMs)
        throw CLI::ValidationError("--to", "this is earlier than --from");
}

template <typename Seconds>
CLI::Option* AddSeconds(CLI::App* command, const char* name, Seconds& seconds, const char* help)
{
    return command->add_option(name, seconds, help)->check(IS_SECONDS)->type_name("S");
}

void AddCount(CLI::App* command, const char* name, uint64_t& count, const char* help)
{
    command->add_option(name, count, help)->check(IS_COUNT)->type_name("N");
}

template <typename Value> using Choices = std::map<std::string, Value>;

template <typename Value>
CLI::Option* AddChoice(CLI::App* command, const char* name, const Choices<Value>& choices, Value& chosen,
                       const char* help)
{
    std::string names;
    for (const auto& choice : choices)
        names += (names.empty() ? "" : ", ") + choice.first;
    const auto check = [choices, names](const std::string& text) {
        return choices.count(text) != 0 ? "" : fmt::format("'{}' is not one of: {}", text, names);
    };
    const auto take = [choices, &chosen](const std::string& text) { chosen = choices.at(text); };
    return command->add_option_function<std::string>(name, take, help)
        ->check(CLI::Validator(check, "", "choice"))
        ->type_name("NAME");
}

const Choices<uint32_t> STREAM_NAMES = {{"video", FLVD_STREAM_VIDEO}, {"audio", FLVD_STREAM_AUDIO}};

void AddInfo(CLI::App* command, InfoOptions& options)
{
    AddFiles(command, options.files, "FLV files; - is standard input");
    command->add_flag("--json", options.json, "Print one JSON document");
    command->add_flag("--scan", options.scan,
                      "Go through the whole file: count frames and\nskipped bytes, and measure keyframe distances");
    command->footer("  flvdmx info clip.flv\n"
                    "  flvdmx info --scan --json *.flv\n"
                    "  curl http://host/clip.flv | flvdmx info -");
}

void AddFrames(CLI::App* command, FramesOptions& options)
{
    AddFile(command, options.file);
    CLI::Option* const json = command->add_flag_callback(
        "--json", [&options] { options.format = Format::json; }, "Print one JSON object per line");
    command
        ->add_flag_callback(
            "--csv", [&options] { options.format = Format::csv; },
            "Print comma-separated values, with column names\non the first line")
        ->excludes(json);
    command->add_flag("--keyframes", options.keyframes, "List only video keyframes");
    AddChoice(command, "--stream", STREAM_NAMES, options.streams, "List only this stream: video or audio");
    AddCount(command, "--count", options.count, "Stop after N frames");
    AddRange(command, options, "Begin at the keyframe at or before TIME;\nwithout video, at TIME",
             "Omit frames later than TIME");
    command->add_flag("--separate-audio", options.separateAudio,
                      "Use a separate audio reader; the streams are\nmerged by time");
    command->add_flag("--follow", options.follow,
                      "Print frames as they arrive: the file is still\nbeing written, or does not exist yet");
    const CLI::Option* const timeout =
        AddSeconds(command, "--timeout", options.timeoutSeconds,
                   "With --follow: stop when the file has not grown\nfor S seconds (default 5)");
    command->parse_complete_callback([&options, timeout] {
        if (timeout->count() != 0 && !options.follow)
            throw CLI::RequiresError("--timeout", "--follow");
        if (options.keyframes && options.streams == FLVD_STREAM_AUDIO)
            throw CLI::ValidationError("--keyframes", "only video frames are keyframes");
        CheckRange(options);
    });
    command->footer(fmt::format("Each line holds number, stream, whether it is a video keyframe, time,\n"
                                "presentation time, size in bytes, position in the file, and CRC-32.\n{}\n\n"
                                "  flvdmx frames clip.flv\n"
                                "  flvdmx frames --stream video --from 1:30 --to 1:35 clip.flv\n"
                                "  flvdmx frames --keyframes --csv clip.flv >keyframes.csv\n"
                                "  flvdmx frames --follow --timeout 10 recording.flv",
                                TIME_HELP));
}

void AddSeek(CLI::App* command, SeekOptions& options)
{
    AddFile(command, options.file);
    AddTime(command, "TIME", options.timeMs, "Where to seek to")->required()->type_name("");
    const Choices<uint32_t> modes = {{"backward", FLVD_SEEK_BACKWARD}, {"forward", FLVD_SEEK_FORWARD}, {"auto", 0}};
    AddChoice(command, "--mode", modes, options.direction,
              "Land on the keyframe at or before TIME (backward,\n"
              "the default) or at or after it (forward);\n"
              "auto: forward, unless TIME is before the current\n"
              "position");
    const auto addBit = [&](const char* name, uint32_t bit, const char* help) {
        command->add_flag_callback(
            name, [&options, bit] { options.mode |= bit; }, help);
    };
    addBit("--relative", FLVD_SEEK_RELATIVE, "TIME is an offset from the current position,\nand may be negative");
    addBit("--end-on-miss", FLVD_SEEK_TO_END_ON_MISS, "After a miss, go to the end of the file");
    addBit("--retry-backward", FLVD_SEEK_RETRY_BACKWARD, "Try backward after a miss");
    AddCount(command, "--play", options.play, "Read N frames before the seek (default 0)");
    AddCount(command, "--count", options.count, "Show N frames after the seek (default 5)");
    command->add_flag("--separate-audio", options.separateAudio, "Use a separate audio reader");
    command->add_flag("--json", options.json, "Print one JSON document");
    command->footer(fmt::format("{}\n\n"
                                "  flvdmx seek clip.flv 12.5\n"
                                "  flvdmx seek --mode forward clip.flv 1:02:03\n"
                                "  flvdmx seek --play 500 --relative clip.flv -10",
                                TIME_HELP));
    command->parse_complete_callback([&options] {
        if (options.timeMs < 0 && (options.mode & FLVD_SEEK_RELATIVE) == 0)
            throw CLI::ValidationError("TIME", "a negative time needs --relative");
    });
}

void AddExtract(CLI::App* command, ExtractOptions& options)
{
    AddFile(command, options.file);
    AddOutput(command, options.out, options.force, "Where to write; - is standard output");
    AddChoice(command, "--stream", STREAM_NAMES, options.streams, "Write only this stream: video or audio");
    command->footer(R"(If the file has one stream, or --stream selects one, OUT is the name of the file
to write. Two streams are written to two files OUT.EXTENSION, such as OUT.h264
and OUT.aac. If OUT is an existing folder, the files in it are named after FILE.
Extensions: h264 (AVC as Annex B), aac (ADTS), mp3, wav (PCM). Other codecs are
written raw, one frame after the other, with the extension video or audio.

  flvdmx extract clip.flv -o clip
  flvdmx extract --stream audio clip.flv -o sound.aac
  flvdmx extract --stream video clip.flv -o - | player -)");
}

void AddCheck(CLI::App* command, CheckOptions& options)
{
    AddFiles(command, options.files, "FLV files, or folders of them; - is standard input");
    command->add_flag("--json", options.json, "Print one JSON document");
    command->add_option("--jobs", options.jobs, "Check up to N files at the same time, at most 256\n(default 1)")
        ->check(CLI::Range(1, 256).description(""))
        ->type_name("N");
    AddSeconds(command, "--jump", options.jumpSeconds,
               "Report times that jump forward by more than\nS seconds (default 10)");
    AddSeconds(command, "--max-gap", options.maxGapSeconds,
               "Report keyframes that are more than S seconds\n"
               "apart, and audio and video that are more than\n"
               "S seconds apart in the file");
    command->footer(R"(Findings, one line per cause:
  gap                bytes that belong to no tag
  cut_short          the end of the last tag, or of the data that the metadata
                     announces, is missing
  back_pointer       the back-pointer of a tag is wrong
  no_back_pointer    the back-pointer of a tag is missing
  passed_over        tags that players skip: their stream or codec is not
                     played, or they are later than the last timestamp, empty
                     or too short
  jump               time jumps back, or forward by more than --jump, within a
                     stream; or a single tag has a wrong time
  index              an entry does not point to a keyframe, or its time is
                     wrong by more than a second
  keyframe_distance  keyframes, or the last one and the end, are more than
                     --max-gap apart
  interleaving       audio and video at the same position in the file are more
                     than --max-gap apart in time
  no_configuration   AAC audio starts without its configuration
  not_playable       the file cannot be opened for playing
Notes, which are not faults, one line per stream:
  configuration      a codec configuration changes
  codec              FLV does not define a codec of the file
  pause              one stream has no frames for longer than --jump, while the
                     other one has
The first 1000 findings of a file are listed; all are counted.

Exit status: 0 no findings, 1 a file has findings or could not be read,
2 usage error.)");
}

void AddPlot(CLI::App* command, PlotOptions& options)
{
    AddFile(command, options.file);
    AddOutput(command, options.out, options.force, "SVG file to write; - is standard output");
    command->footer("The manual page explains the drawing.\n\n"
                    "  flvdmx plot clip.flv -o clip.svg");
}

void AddRewrite(CLI::App* command, RewriteOptions& options)
{
    AddFile(command, options.file);
    CLI::Option* const out = AddOutput(command, options.out, options.force, "FLV file to write; - is standard output");
    const auto dryRun = [&options, out] {
        options.dryRun = true;
        out->required(false);
    };
    command->add_flag_callback("--dry-run", dryRun, "Report what would be written, and write nothing;\nneeds no OUT")
        ->trigger_on_parse();
}

void AddRepair(CLI::App* command, RewriteOptions& options)
{
    AddRewrite(command, options);
    command->add_flag("--keep-times", options.keepTimes, "Leave timestamps that restart or jump as they are");
    command->footer(R"(Frames, codec configurations and cue points are kept; damage and other bytes are
dropped. The metadata gets a new duration, file size and keyframe index.
Timestamps that go back by more than a second or forward by more than ten are
made continuous, and single wrong ones are replaced.

  flvdmx repair recording.flv -o repaired.flv)");
}

void AddIndex(CLI::App* command, RewriteOptions& options)
{
    AddRewrite(command, options);
    command->footer("All tags except the metadata are copied unchanged.\n\n"
                    "  flvdmx index recording.flv -o seekable.flv");
}

void AddCut(CLI::App* command, RewriteOptions& options)
{
    AddRewrite(command, options);
    AddRange(command, options, "Begin at the keyframe at or before TIME", "End before the keyframe at or after TIME");
    command->parse_complete_callback([&options] { CheckRange(options); });
    command->add_flag("--keep-times", options.keepTimes, "Leave the timestamps as they are instead of\nstarting at 0");
    command->footer(fmt::format("{}\n\n"
                                "  flvdmx cut film.flv --from 1:00 --to 2:30 -o part.flv",
                                TIME_HELP));
}

// CLI11 mistakes `-5` for an option. After a space it is a value, and ParseTime skips spaces.
std::vector<std::string> Arguments(int argc, char** argv)
{
    std::vector<std::string> arguments(argv + 1, argv + argc);
    for (std::string& text : arguments) {
        if (text == "--") // only file names follow
            break;
        if (!text.empty() && text.front() == '-' && ParseTime(text))
            text.insert(0, 1, ' ');
    }
    return {arguments.rbegin(), arguments.rend()}; // CLI11 expects them in reverse
}

// Returns a hint if an argument that looks like an option is the name of a file.
std::string DashAdvice(const std::vector<std::string>& arguments)
{
    std::error_code failure;
    const auto end = std::find(arguments.begin(), arguments.end(), "--");
    for (const std::string& text : arguments)
        if (end == arguments.end() && text.size() > 1 && text.front() == '-' && std::filesystem::exists(text, failure))
            return fmt::format("Put '--' before a file name that begins with a dash: flvdmx COMMAND -- {}\n",
                               Printable(text));
    return "";
}

int Usage(const CLI::App& app, const CLI::ParseError& error, const std::vector<std::string>& arguments)
{
    const std::vector<CLI::App*> commands = app.get_subcommands();
    std::string text = error.what();
    if (commands.empty() && app.remaining_size() > 0)
        text = fmt::format("'{}' is not a command or option", app.remaining().front());
    Tell(fmt::format("flvdmx: {}\n{}Try 'flvdmx {}--help'.\n", Printable(text), DashAdvice(arguments),
                     commands.empty() ? "" : commands.front()->get_name() + " "));
    return WRONG_USE;
}

// Otherwise a file opened later could get the descriptor of a closed standard stream, and messages would be written to
// it. The replacement of standard output is not writable, so that writing fails and the failure is reported.
void OccupyStandardStreams()
{
    for (int descriptor = STDIN_FILENO; descriptor <= STDERR_FILENO; ++descriptor)
        if (fcntl(descriptor, F_GETFD) < 0)
            open("/dev/null", descriptor == STDERR_FILENO ? O_RDWR | O_CLOEXEC : O_RDONLY | O_CLOEXEC);
}

// Adds a command that sets the exit status when it has run.
template <typename Options>
void AddCommand(CLI::App& app, int& status, const char* name, const char* help, void (*describe)(CLI::App*, Options&),
                int (*execute)(const Options&))
{
    const auto options = std::make_shared<Options>();
    CLI::App* const command = app.add_subcommand(name, help)->group("Commands");
    describe(command, *options);
    command->final_callback([&status, execute, options] { status = execute(*options); });
}

void AddHelp(CLI::App& app)
{
    Choices<CLI::App*> topics;
    for (CLI::App* const command : app.get_subcommands(nullptr))
        topics[command->get_name()] = command;
    CLI::App* const help = app.add_subcommand("help", "Print help, or help for a command")->group("Commands");
    topics["help"] = help;
    const auto topic = std::make_shared<CLI::App*>(&app);
    AddChoice(help, "COMMAND", topics, *topic, "A command")->type_name("");
    help->final_callback([&app, topic] {
        const std::string name = *topic == &app ? "flvdmx" : "flvdmx " + (*topic)->get_name();
        Print(app.get_formatter()->make_help(*topic, name, CLI::AppFormatMode::Normal));
    });
}

void SetLabels(CLI::App& app)
{
    for (const auto& [label, text] :
         {std::pair("SUBCOMMAND", "COMMAND"), {"Positionals", "Arguments"}, {"REQUIRED", "(required)"}})
        app.get_formatter()->label(label, text);
}

int Run(int argc, char** argv)
{
    CLI::App app("Inspects, checks, repairs and demultiplexes FLV files.", "flvdmx");
    SetLabels(app);
    app.set_help_flag("-h,--help", "Print help");
    app.set_version_flag("-V,--version", "flvdmx " FLVDMX_VERSION, "Print the version");
    app.add_flag_callback("--verbose", ShowCodes,
                          "With any command: if something fails, also print\nthe library's error code and line number")
        ->trigger_on_parse();
    app.fallthrough();
    app.footer("Exit status: 0 done, 1 a file could not be read, written or played, or check\n"
               "found something, 2 usage error. 'flvdmx help COMMAND' explains a command.");
    app.require_subcommand(0, 1); // a missing command is reported below, after CLI11 has rejected unknown words
    int status = DONE;
    AddCommand(app, status, "info", "Show what is in each file", AddInfo, RunInfo);
    AddCommand(app, status, "frames", "List the frames, one per line", AddFrames, RunFrames);
    AddCommand(app, status, "seek", "Seek, and show where that leads", AddSeek, RunSeek);
    AddCommand(app, status, "extract", "Write the streams to files that players accept", AddExtract, RunExtract);
    AddCommand(app, status, "check", "Find damage, jumping times, a wrong index", AddCheck, RunCheck);
    AddCommand(app, status, "plot", "Draw bit rate, keyframes and interleaving", AddPlot, RunPlot);
    AddCommand(app, status, "repair", "Write a valid file from what can be played", AddRepair, RunRepair);
    AddCommand(app, status, "index", "Copy an undamaged file, with a keyframe index", AddIndex, RunIndex);
    AddCommand(app, status, "cut", "Write part of a file, with its own index", AddCut, RunCut);
    AddHelp(app);
    try {
        app.parse(Arguments(argc, argv));
        if (app.get_subcommands().empty())
            throw CLI::RequiredError(
                "A command (info, frames, seek, extract, check, plot, repair, index, cut or help)");
    } catch (const CLI::CallForHelp&) {
        Print(app.help());
        return DONE;
    } catch (const CLI::CallForVersion& version) {
        Print(std::string(version.what()) + "\n");
        return DONE;
    } catch (const CLI::ParseError& error) {
        return Usage(app, error, {argv + 1, argv + argc});
    }
    return status;
}

} // namespace

} // namespace tool

// Reports all failures. A program such as `head` closes the pipe when it has seen enough, which is not a failure.
int main(int argc, char** argv)
{
    std::signal(SIGPIPE, SIG_IGN);
    tool::OccupyStandardStreams();
    try {
        const int exitCode = tool::Run(argc, argv);
        tool::Flush();
        return exitCode;
    } catch (const tool::FileError& error) {
        tool::Complain(error);
    } catch (const std::system_error& error) {
        if (error.code() == std::errc::broken_pipe)
            return tool::DONE;
        tool::Tell(fmt::format("flvdmx: cannot write: {}\n", error.code().message()));
    } catch (const std::exception& error) {
        tool::Tell(fmt::format("flvdmx: {}\n", error.what()));
    }
    return tool::FAILED;
}
