// The command line.
#include <algorithm>
#include <csignal>
#include <exception>
#include <filesystem>
#include <functional>
#include <map>
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
#include "tools/text.h"

#ifndef FLVDMX_VERSION
#define FLVDMX_VERSION "unknown version"
#endif

namespace tool {

namespace {

constexpr const char* TIME_HELP = "TIME is seconds (12.5) or [HH:]MM:SS[.FRACTION].";

// What CLI11 shows when a value is refused; an empty text accepts it.
const CLI::Validator IS_TIME(
    [](const std::string& text) {
        return ParseTime(text) ? std::string() : fmt::format("'{}' is no time: seconds or [HH:]MM:SS[.FRACTION]", text);
    },
    "", "time");

// Signs are refused, which the conversion to an unsigned number lets pass.
const CLI::Validator IS_COUNT(
    [](const std::string& text) {
        const bool digits = text.find_first_not_of("0123456789") == std::string::npos;
        return digits ? std::string() : fmt::format("'{}' is no number of frames", text);
    },
    "", "count");

constexpr double MOST_SECONDS = 4294967; // 32 bits of milliseconds

const CLI::Validator IS_SECONDS(
    [](const std::string& text) {
        double seconds = -1;
        const bool valid = CLI::detail::lexical_cast(text, seconds) && seconds >= 0 && seconds <= MOST_SECONDS;
        return valid ? std::string() : fmt::format("'{}' is no number of seconds", text);
    },
    "", "seconds");

const CLI::Validator IS_NAME([](const std::string& text) { return std::string(text.empty() ? "no name" : ""); }, "",
                             "name");

CLI::Option* AddTime(CLI::App* command, const char* name, const std::function<void(int32_t)>& take, const char* help)
{
    const auto parse = [take](const std::string& text) { take(ParseTime(text).value_or(0)); };
    return command->add_option_function<std::string>(name, parse, help)->check(IS_TIME)->type_name("TIME");
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

const Choices<uint32_t> STREAMS = {{"video", FLVD_STREAM_VIDEO}, {"audio", FLVD_STREAM_AUDIO}};

void AddInfo(CLI::App& app, InfoOptions& options)
{
    CLI::App* const command = app.add_subcommand("info", "Show what is in each file");
    command->add_option("FILE", options.files, "FLV files; - is standard input")->required()->type_name("");
    command->add_flag("--json", options.json, "Print one JSON document");
    command->add_flag("--scan", options.scan,
                      "Read the whole file: count frames and what is left out, measure keyframe distances");
    command->footer("  flvdmx info clip.flv\n"
                    "  flvdmx info --scan --json *.flv\n"
                    "  curl http://host/clip.flv | flvdmx info -");
}

CLI::Option* AddFollow(CLI::App* command, FramesOptions& options)
{
    command->add_flag("--follow", options.follow,
                      "The file is still being written, or not there yet: wait for more and print it as it comes");
    return command
        ->add_option("--timeout", options.timeoutSeconds,
                     "With --follow: stop when the file has not grown for S seconds (default 5)")
        ->check(IS_SECONDS)
        ->type_name("S");
}

void AddFrames(CLI::App& app, FramesOptions& options)
{
    CLI::App* const command = app.add_subcommand("frames", "List the frames, one per line");
    command->add_option("FILE", options.file, "FLV file; - is standard input")->required()->type_name("");
    CLI::Option* const json = command->add_flag_callback(
        "--json", [&options] { options.format = Format::json; }, "Print one JSON object per line");
    command
        ->add_flag_callback(
            "--csv", [&options] { options.format = Format::csv; }, "Print comma-separated values after a line of names")
        ->excludes(json);
    command->add_flag("--keyframes", options.keyframes, "List only the keyframes of the video");
    AddChoice(command, "--stream", STREAMS, options.streams, "List only this stream: video or audio");
    AddCount(command, "--count", options.count, "Stop after N frames");
    AddTime(
        command, "--from", [&options](int32_t ms) { options.fromMs = ms; },
        "Begin at the keyframe at or before TIME; audio alone begins at TIME");
    AddTime(
        command, "--to", [&options](int32_t ms) { options.toMs = ms; }, "Leave out frames later than TIME");
    command->add_flag("--separate-audio", options.separateAudio,
                      "Read audio with a reader of its own; the streams are merged by time");
    const CLI::Option* const timeout = AddFollow(command, options);
    command->callback([&options, timeout] {
        if (timeout->count() != 0 && !options.follow)
            throw CLI::RequiresError("--timeout", "--follow");
        if (options.keyframes && options.streams == FLVD_STREAM_AUDIO)
            throw CLI::ValidationError("--keyframes", "these are frames of the video");
    });
    command->footer(fmt::format("Each line holds number, stream, whether it is a keyframe of the video, time, time to\n"
                                "show it, size in bytes, place in the file, and CRC-32 of the bytes.\n{}\n\n"
                                "  flvdmx frames clip.flv\n"
                                "  flvdmx frames --stream video --from 1:30 --to 1:35 clip.flv\n"
                                "  flvdmx frames --keyframes --csv clip.flv >keyframes.csv\n"
                                "  flvdmx frames --follow --timeout 10 recording.flv",
                                TIME_HELP));
}

void AddSeekModes(CLI::App* command, SeekOptions& options)
{
    const Choices<uint32_t> modes = {{"backward", FLVD_SEEK_BACKWARD}, {"forward", FLVD_SEEK_FORWARD}, {"auto", 0}};
    AddChoice(command, "--mode", modes, options.direction,
              "Land on the keyframe at or before TIME (backward, the default) or at or after it (forward); "
              "auto: forward, unless TIME is before the current position");
    const auto addBit = [&](const char* name, uint32_t bit, const char* help) {
        command->add_flag_callback(
            name, [&options, bit] { options.mode |= bit; }, help);
    };
    addBit("--relative", FLVD_SEEK_RELATIVE, "TIME is an offset from the current position and may be negative");
    addBit("--end-on-miss", FLVD_SEEK_TO_END_ON_MISS, "Go to the end of the file when there is nothing to land on");
    addBit("--retry-backward", FLVD_SEEK_RETRY_BACKWARD, "Try backward when there is nothing to land on");
}

void AddSeek(CLI::App& app, SeekOptions& options)
{
    CLI::App* const command = app.add_subcommand("seek", "Seek, show the landing place and the frames from there on");
    command->add_option("FILE", options.file, "FLV file; - is standard input")->required()->type_name("");
    AddTime(
        command, "TIME", [&options](int32_t ms) { options.timeMs = ms; }, "Where to seek to")
        ->required()
        ->type_name("");
    AddSeekModes(command, options);
    AddCount(command, "--play", options.play, "Read N frames before the seek (default 0)");
    AddCount(command, "--count", options.count, "Show N frames from the landing place on (default 5)");
    command->add_flag("--separate-audio", options.separateAudio, "Read audio with a reader of its own");
    command->add_flag("--json", options.json, "Print one JSON document");
    command->footer(fmt::format("{}\n\n"
                                "  flvdmx seek clip.flv 12.5\n"
                                "  flvdmx seek --mode forward clip.flv 1:02:03\n"
                                "  flvdmx seek --play 500 --relative clip.flv -10",
                                TIME_HELP));
    command->callback([&options] {
        if (options.timeMs < 0 && (options.mode & FLVD_SEEK_RELATIVE) == 0)
            throw CLI::ValidationError("TIME", "a negative time needs --relative");
    });
}

void AddExtract(CLI::App& app, ExtractOptions& options)
{
    CLI::App* const command = app.add_subcommand("extract", "Write the streams to files that players take");
    command->add_option("FILE", options.file, "FLV file; - is standard input")->required()->type_name("");
    command->add_option("-o,--output", options.out, "Where to write; - is standard output")
        ->required()
        ->check(IS_NAME)
        ->type_name("OUT");
    AddChoice(command, "--stream", STREAMS, options.streams, "Write only this stream: video or audio");
    command->add_flag("--force", options.force, "Overwrite files that exist");
    command->footer(
        "OUT is the file to write when there is one stream, or --stream chooses one. Of two streams it is the\n"
        "beginning of the names: OUT.h264 and OUT.aac, for instance. A folder that exists takes files\n"
        "named as FILE. Extensions: h264 (Annex B), aac (ADTS), mp3, wav (PCM); video and audio for all else,\n"
        "which is written raw.\n\n"
        "  flvdmx extract clip.flv -o clip\n"
        "  flvdmx extract --stream audio clip.flv -o sound.aac\n"
        "  flvdmx extract --stream video clip.flv -o - | player -");
}

void AddCheck(CLI::App& app, CheckOptions& options)
{
    CLI::App* const command = app.add_subcommand("check", "Judge files: damage, timestamps, keyframe index");
    command->add_option("FILE", options.files, "FLV files, and folders of them; - is standard input")
        ->required()
        ->type_name("");
    command->add_flag("--json", options.json, "Print one JSON document");
    command->add_option("--jobs", options.jobs, "Check N files at the same time (default 1)")
        ->check(CLI::Range(1, 256))
        ->type_name("N");
    command
        ->add_option("--jump", options.jumpSeconds, "Report steps forward in time of more than S seconds (default 10)")
        ->check(IS_SECONDS)
        ->type_name("S");
    command
        ->add_option("--max-gap", options.maxGapSeconds,
                     "Report keyframes more than S seconds apart, and audio and video of which one is more than S "
                     "seconds ahead in the file")
        ->check(IS_SECONDS)
        ->type_name("S");
    command->footer("What is found, one line per cause:\n"
                    "  gap                bytes that belong to no tag\n"
                    "  cut_short          the end of the last tag, or of what the metadata announces, is missing\n"
                    "  back_pointer       the size after a tag is wrong\n"
                    "  no_back_pointer    there is none\n"
                    "  passed_over        tags that a player leaves out: of another codec, too late, too short\n"
                    "  jump               time runs back, or forward by more than --jump, within a stream\n"
                    "  index              an entry leads to no keyframe, or its time is wrong by more than a second\n"
                    "  keyframe_distance  keyframes are more than --max-gap apart\n"
                    "  interleaving       audio and video are more than --max-gap apart in the file\n"
                    "  not_playable       the file cannot be opened for playing\n"
                    "  configuration      a codec configuration changes: listed, but no fault\n"
                    "  pause              one stream stops for longer than --jump, the other continues: no fault\n"
                    "The first 1000 findings of a file are listed, all are counted.\n\n"
                    "Exit codes: 0 all files are ok, 1 something was found or a file could not be read.");
}

void AddPlot(CLI::App& app, PlotOptions& options)
{
    CLI::App* const command = app.add_subcommand("plot", "Draw bit rate, keyframes and interleaving over time");
    command->add_option("FILE", options.file, "FLV file; - is standard input")->required()->type_name("");
    command->add_option("-o,--output", options.out, "SVG file to write; - is standard output")
        ->required()
        ->check(IS_NAME)
        ->type_name("OUT");
    command->add_flag("--force", options.force, "Overwrite a file that exists");
    command->footer("The manual page explains the drawing.\n\n"
                    "  flvdmx plot clip.flv -o clip.svg");
}

CLI::App* AddRewrite(CLI::App& app, const char* name, const char* help, RewriteOptions& options)
{
    CLI::App* const command = app.add_subcommand(name, help);
    command->add_option("FILE", options.file, "FLV file; - is standard input")->required()->type_name("");
    command->add_option("-o,--output", options.out, "FLV file to write; - is standard output")
        ->required()
        ->check(IS_NAME)
        ->type_name("OUT");
    command->add_flag("--force", options.force, "Overwrite a file that exists");
    command->add_flag("--dry-run", options.dryRun, "Say what would be written, and write nothing");
    return command;
}

void AddRepair(CLI::App& app, RewriteOptions& options)
{
    CLI::App* const command =
        AddRewrite(app, "repair", "Write a valid file from everything that can be played", options);
    command->add_flag("--keep-times", options.keepTimes, "Leave timestamps that restart or jump as they are");
    command->footer("Frames, codec configurations and cue points are kept, damage and other bytes are dropped. The\n"
                    "metadata gets a new duration, file size and keyframe index. Timestamps that go back by more than\n"
                    "a second or forward by more than ten are made continuous, single wrong ones replaced.\n\n"
                    "  flvdmx repair recording.flv -o repaired.flv");
}

void AddIndex(CLI::App& app, RewriteOptions& options)
{
    AddRewrite(app, "index", "Copy an undamaged file and give it a keyframe index", options)
        ->footer("All tags but the metadata are copied as they are.\n\n"
                 "  flvdmx index recording.flv -o seekable.flv");
}

void AddCut(CLI::App& app, RewriteOptions& options)
{
    CLI::App* const command = AddRewrite(app, "cut", "Write a part of a file, with an index of its own", options);
    AddTime(
        command, "--from", [&options](int32_t ms) { options.fromMs = ms; }, "Begin at the keyframe at or before TIME");
    AddTime(
        command, "--to", [&options](int32_t ms) { options.toMs = ms; }, "End before the keyframe at or after TIME");
    command->add_flag("--keep-times", options.keepTimes, "Leave the timestamps as they are instead of starting at 0");
    command->footer(fmt::format("{}\n\n"
                                "  flvdmx cut film.flv --from 1:00 --to 2:30 -o part.flv",
                                TIME_HELP));
}

// CLI11 takes `-5` for an option. After a blank it is a value, and ParseTime passes over blanks.
std::vector<std::string> Arguments(int argc, char** argv)
{
    std::vector<std::string> arguments(argv + 1, argv + argc);
    for (std::string& text : arguments) {
        if (text == "--") // names only from here on
            break;
        if (!text.empty() && text.front() == '-' && ParseTime(text))
            text.insert(0, 1, ' ');
    }
    return {arguments.rbegin(), arguments.rend()}; // as CLI11 wants them
}

// What the user typed may be the name of a file that looks like an option.
std::string DashAdvice(const std::vector<std::string>& arguments)
{
    std::error_code failure;
    for (const std::string& text : arguments)
        if (text.size() > 1 && text.front() == '-' && std::filesystem::exists(text, failure))
            return fmt::format("A file name that begins with a dash goes after '--': flvdmx COMMAND -- {}\n",
                               Printable(text));
    return "";
}

int Usage(const CLI::App& app, const CLI::ParseError& error, const std::vector<std::string>& arguments)
{
    const std::vector<CLI::App*> commands = app.get_subcommands();
    Tell(fmt::format("flvdmx: {}\n{}Try 'flvdmx {}--help'.\n", Printable(error.what()), DashAdvice(arguments),
                     commands.empty() ? "" : commands.front()->get_name() + " "));
    return WRONG_USE;
}

// A file that is opened must not take the number of a standard stream that was closed: it would get the messages. Where
// output should go nothing can be written, so that it is noticed.
void OccupyStandardStreams()
{
    for (int descriptor = STDIN_FILENO; descriptor <= STDERR_FILENO; ++descriptor)
        if (fcntl(descriptor, F_GETFD) < 0)
            open("/dev/null", descriptor == STDERR_FILENO ? O_RDWR | O_CLOEXEC : O_RDONLY | O_CLOEXEC);
}

void AddHelp(CLI::App& app, std::string& topic)
{
    CLI::App* const command = app.add_subcommand("help", "Print help; of a command, the command's");
    Choices<std::string> names;
    for (const CLI::App* const known : app.get_subcommands([](CLI::App*) { return true; }))
        names[known->get_name()] = known->get_name();
    AddChoice(command, "COMMAND", names, topic, "Command to explain")->type_name("");
}

int Run(int argc, char** argv)
{
    CLI::App app("Shows what is in FLV files, checks, repairs and cuts them.", "flvdmx");
    app.set_version_flag("-V,--version", "flvdmx " FLVDMX_VERSION);
    app.add_flag_callback("--verbose", ShowCodes, "Tell the library's code and line of a failure")->trigger_on_parse();
    app.fallthrough();
    app.footer("Exit codes: 0 done, 1 a file could not be handled or something was found wrong, 2 wrong use.");
    app.require_subcommand(0, 1); // none is told below, after what CLI11 has to say of unknown words
    InfoOptions info;
    FramesOptions frames;
    SeekOptions seek;
    ExtractOptions extract;
    CheckOptions check;
    PlotOptions plot;
    RewriteOptions repair;
    RewriteOptions index;
    RewriteOptions cut;
    std::string topic;
    AddInfo(app, info);
    AddFrames(app, frames);
    AddSeek(app, seek);
    AddExtract(app, extract);
    AddCheck(app, check);
    AddPlot(app, plot);
    AddRepair(app, repair);
    AddIndex(app, index);
    AddCut(app, cut);
    AddHelp(app, topic);
    try {
        app.parse(Arguments(argc, argv));
        if (app.get_subcommands().empty())
            throw CLI::RequiredError(
                "A command (info, frames, seek, extract, check, plot, repair, index, cut or help)");
    } catch (const CLI::CallForHelp&) {
        Print(app.help());
        return DONE;
    } catch (const CLI::CallForVersion&) {
        Print("flvdmx " FLVDMX_VERSION "\n");
        return DONE;
    } catch (const CLI::ParseError& error) {
        return Usage(app, error, {argv + 1, argv + argc});
    }
    const std::map<std::string, std::function<int()>> commands = {
        {"info", [&] { return RunInfo(info); }},
        {"frames", [&] { return RunFrames(frames); }},
        {"seek", [&] { return RunSeek(seek); }},
        {"extract", [&] { return RunExtract(extract); }},
        {"check", [&] { return RunCheck(check); }},
        {"plot", [&] { return RunPlot(plot); }},
        {"repair", [&] { return RunRepair(repair); }},
        {"index", [&] { return RunIndex(index); }},
        {"cut", [&] { return RunCut(cut); }},
        {"help", [&] {
             Print(topic.empty() ? app.get_formatter()->make_help(&app, "flvdmx", CLI::AppFormatMode::Normal)
                                 : app.get_subcommand(topic)->help("flvdmx"));
             return DONE;
         }}};
    return commands.at(app.get_subcommands().front()->get_name())();
}

} // namespace

} // namespace tool

// The one place where failures end. A reader that has seen enough, such as `head`, closes the pipe: that is none.
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
