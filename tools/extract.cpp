// `flvdmx extract`: writes elementary streams that players accept.
#include <cstdint>
#include <filesystem>
#include <limits>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include <fmt/core.h>

#include "tools/commands.h"
#include "tools/formats.h"
#include "tools/frame_source.h"
#include "tools/input.h"
#include "tools/output_file.h"
#include "tools/played.h"
#include "tools/progress.h"
#include "tools/report.h"
#include "tools/text.h"

namespace tool {

namespace {

// Writes one stream to its file.
class StreamWriter {
public:
    StreamWriter(const Input& input, flvdmx::Stream stream)
        : m_file(input.name), m_stream(stream), m_format(FormatOf(input, stream))
    {
        const bool video = stream == flvdmx::Stream::video;
        const std::string refusal = m_format->Configure(video ? input.info.video->config : input.info.audio->config);
        if (!refusal.empty())
            throw FileError(m_file, refusal);
    }

    flvdmx::Stream Stream() const { return m_stream; }

    // Files in a folder are named after the input; two streams need two names.
    void Open(const ExtractOptions& options, bool both)
    {
        const std::string base = m_file == STANDARD_STREAM ? "stdin" : std::filesystem::path(m_file).stem().string();
        std::error_code failure;
        if (options.out != STANDARD_STREAM && std::filesystem::is_directory(options.out, failure))
            Open(std::filesystem::path(options.out) / (base + "." + m_format->Extension()), options.force);
        else
            Open(both ? options.out + "." + m_format->Extension() : options.out, options.force);
    }

    void Take(const flvdmx::Frame& frame)
    {
        if (frame.config_changed())
            if (const std::string refusal = m_format->Configure(frame.new_config); !refusal.empty())
                Complain(m_file, fmt::format("warning: before byte {}: {}; the previous configuration stays in use",
                                             frame.position, refusal));
        m_bytes.clear();
        if (const char* const fault = m_format->Convert(frame, m_bytes); fault != nullptr && m_faults++ == 0) {
            m_fault = fault;
            m_firstFault = frame.position;
        }
        m_out->Write(m_bytes.data(), m_bytes.size());
        ++m_frames;
    }

    // Completes the file; a stream without frames leaves none. @return true if there were frames
    bool Finish()
    {
        if (m_faults > 0)
            Complain(m_file, fmt::format("warning: skipped {} in {}, the first at byte {}", m_fault,
                                         Plural(m_faults, "frame"), m_firstFault));
        const uint64_t written = m_out->Written() - m_format->Header(0).size();
        if (written == 0) {
            Complain(m_file, fmt::format("note: there are no {} frames to write: {} is not created",
                                         StreamName(m_stream), Printable(m_out->Path())));
            return false;
        }
        if (const std::vector<uint8_t> header = m_format->Header(written); !header.empty())
            m_out->Rewrite(header);
        m_out->Finish();
        if (m_format->IsRaw())
            Complain(m_file, fmt::format("note: the {} is written raw: the bare frames, one after the other",
                                         StreamName(m_stream)));
        if (!m_out->IsStandard())
            Print(fmt::format("{}: {}, {} bytes\n", Printable(m_out->Path()), Plural(m_frames, "frame"),
                              m_out->Written()));
        return true;
    }

private:
    // Until the size is known, the header states the largest one; in a pipe it cannot be corrected.
    void Open(const std::string& path, bool force)
    {
        m_out = std::make_unique<OutputFile>(path, m_file, force);
        const std::vector<uint8_t> header = m_format->Header(std::numeric_limits<uint64_t>::max());
        m_out->Write(header.data(), header.size());
    }

    const std::string m_file;
    const flvdmx::Stream m_stream;
    std::unique_ptr<StreamFormat> m_format;
    std::unique_ptr<OutputFile> m_out;
    std::vector<uint8_t> m_bytes;
    uint64_t m_frames = 0;
    const char* m_fault = "";
    uint64_t m_faults = 0;
    int64_t m_firstFault = 0;
};

std::vector<StreamWriter> MakeWriters(const ExtractOptions& options, const Input& input)
{
    std::vector<StreamWriter> writers;
    std::string missing;
    for (const flvdmx::Stream stream : STREAMS) {
        if ((options.streams & static_cast<uint32_t>(stream)) == 0)
            continue;
        if (input.Has(stream))
            writers.emplace_back(input, stream);
        else if (const std::string why = Played(input).WhyNoStream(stream); !why.empty())
            missing = " that is played: " + why;
    }
    if (writers.empty())
        throw FileError(input.name, fmt::format("the file has no {} stream{}",
                                                StreamName(static_cast<flvdmx::Stream>(options.streams)), missing));
    if (options.out == STANDARD_STREAM && writers.size() > 1)
        throw FileError(input.name,
                        "standard output takes only one stream: select it with --stream video or --stream audio");
    return writers;
}

} // namespace

int RunExtract(const ExtractOptions& options)
{
    Input input(options.file);
    input.WarnIfCutShort();
    std::vector<StreamWriter> writers = MakeWriters(options, input);
    ProgressBar progress(options.file, input.Instance().data_end);
    for (StreamWriter& writer : writers)
        writer.Open(options, writers.size() > 1);
    input.file.accept_all_times();
    Played played(input);
    while (const std::optional<flvdmx::Frame> frame = NextFrame(input)) {
        progress.ShowDone(frame->position);
        played.Take(*frame);
        for (StreamWriter& writer : writers)
            if (writer.Stream() == frame->stream)
                writer.Take(*frame);
    }
    progress.Wipe();
    played.Finish();
    bool written = false;
    for (StreamWriter& writer : writers)
        written = writer.Finish() || written;
    played.Warn();
    return written ? DONE : FAILED;
}

} // namespace tool
