// `flvdmx extract`: writes elementary streams that players accept.
#include <algorithm>
#include <array>
#include <cstdint>
#include <filesystem>
#include <limits>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include <fmt/core.h>

#include "tools/codecs.h"
#include "tools/commands.h"
#include "tools/frame_source.h"
#include "tools/input.h"
#include "tools/output_file.h"
#include "tools/played.h"
#include "tools/progress.h"
#include "tools/report.h"
#include "tools/tags.h"

namespace tool {

namespace {

using Buffer = std::vector<uint8_t>;

void Append(Buffer& out, flvdmx::Bytes bytes)
{
    out.insert(out.end(), bytes.begin(), bytes.end());
}

void AppendLittleEndian(Buffer& out, uint32_t value, uint32_t size)
{
    for (uint32_t i = 0; i < size; ++i)
        out.push_back(static_cast<uint8_t>(value >> 8 * i));
}

// Turns the frames of a codec into a stream.
class StreamFormat {
public:
    explicit StreamFormat(std::string extension) : m_extension(std::move(extension)) {}
    virtual ~StreamFormat() = default;
    StreamFormat(const StreamFormat&) = delete;
    StreamFormat& operator=(const StreamFormat&) = delete;

    const std::string& Extension() const { return m_extension; }

    // Sets the codec configuration of the frames that follow. Returns why it was rejected, in which case the previous
    // one stays in use; empty on success.
    virtual std::string Configure(flvdmx::Bytes /*config*/) { return {}; }

    // Returns the header of a stream whose frames have this many bytes.
    virtual Buffer Header(uint64_t /*bytes*/) const { return {}; }

    // Appends a frame to `out`. Returns what part of it had to be skipped; null if none.
    virtual const char* Convert(const flvdmx::Frame& frame, Buffer& out)
    {
        Append(out, frame.data);
        return nullptr;
    }

    // True if the bare frames are written, which no player accepts.
    virtual bool IsRaw() const { return false; }

private:
    std::string m_extension;
};

// AVC as a byte stream (ISO/IEC 14496-10, annex B): start codes replace the lengths, and the parameter sets come before
// the first frame and before the first keyframe after each change of the configuration.
class AnnexB : public StreamFormat {
public:
    AnnexB() : StreamFormat("h264") {}

    std::string Configure(flvdmx::Bytes record) override
    {
        constexpr size_t LEAST_RECORD_SIZE = 7;
        constexpr size_t LENGTH_SIZE_OFFSET = 4; // of lengthSizeMinusOne, two bits
        const uint32_t lengthSize = (record[LENGTH_SIZE_OFFSET] & 3U) + 1;
        Buffer sets = AvcParameterSets(record);
        if (record.size() < LEAST_RECORD_SIZE || lengthSize == 3 || sets.empty())
            return "the AVC configuration is damaged";
        m_parameterSets = std::move(sets);
        m_lengthSize = lengthSize;
        m_pending = true;
        return {};
    }

    const char* Convert(const flvdmx::Frame& frame, Buffer& out) override
    {
        constexpr const char* FAULT = "NAL units that exceed their frame";
        if (m_pending && (frame.keyframe || !m_begun)) {
            Append(out, m_parameterSets);
            m_pending = false;
        }
        m_begun = true;
        const uint8_t* const data = frame.data.data();
        const size_t size = frame.data.size();
        for (size_t pos = 0; pos < size;) {
            if (m_lengthSize > size - pos)
                return FAULT;
            const uint32_t length = BigEndian(data + pos, m_lengthSize);
            pos += m_lengthSize;
            if (length > size - pos)
                return FAULT;
            if (length > 0) {
                Append(out, {START_CODE.data(), START_CODE.size()});
                Append(out, {data + pos, length});
            }
            pos += length;
        }
        return nullptr;
    }

private:
    static constexpr std::array<uint8_t, 4> START_CODE = {0, 0, 0, 1};

    Buffer m_parameterSets;
    uint32_t m_lengthSize = 4;
    bool m_begun = false;
    bool m_pending = false; // the parameter sets have not been written
};

// AAC as an audio data transport stream (ISO/IEC 13818-7, 14496-3): a header before every frame. For HE-AAC it
// describes the core; decoders detect the extension in the frames.
class Adts : public StreamFormat {
public:
    Adts() : StreamFormat("aac") {}

    std::string Configure(flvdmx::Bytes config) override
    {
        if (config.empty()) // it may still arrive
            return {};
        const AacConfig aac = ParseAacConfig(config);
        if (std::string refusal = Refusal(aac); !refusal.empty())
            return refusal;
        m_fixed = 0xFFF10000U | (aac.coreObjectType - 1) << 14 | aac.frequencyIndex << 10 | aac.channels << 6;
        return {};
    }

    // Syncword, MPEG-4, no checksum; a buffer fullness of all ones means a variable rate; one raw data block.
    const char* Convert(const flvdmx::Frame& frame, Buffer& out) override
    {
        constexpr uint32_t HEADER_SIZE = 7;
        constexpr uint32_t MOST_BYTES = 0x1FFF; // 13 bits, including the header
        if (frame.data.empty())
            return nullptr;
        if (m_fixed == 0)
            return "data without an AAC configuration";
        if (frame.data.size() > MOST_BYTES - HEADER_SIZE)
            return "data that is too long for ADTS";
        const uint32_t size = static_cast<uint32_t>(frame.data.size()) + HEADER_SIZE;
        const uint64_t header = uint64_t{m_fixed | size >> 11} << 24 | (size << 13 & 0xFFFFFF) | 0x1FFC;
        for (uint32_t shift = 8 * HEADER_SIZE; shift > 0; shift -= 8)
            out.push_back(static_cast<uint8_t>(header >> (shift - 8)));
        Append(out, frame.data);
        return nullptr;
    }

private:
    static std::string Refusal(const AacConfig& aac)
    {
        constexpr uint32_t MOST_OBJECT_TYPE = 4; // stored minus one, in 2 bits
        if (aac.frequencyIndex == AAC_EXPLICIT_FREQUENCY)
            return "AAC with an explicit sampling frequency cannot be written as ADTS";
        if (aac.isShort)
            return "the AAC configuration is cut short";
        if (aac.coreObjectType == 0 || aac.coreObjectType > MOST_OBJECT_TYPE)
            return fmt::format("AAC object type {} cannot be written as ADTS, which has types 1 to 4",
                               aac.coreObjectType);
        if (aac.frequencyIndex >= AAC_FREQUENCIES)
            return fmt::format("the AAC configuration has the reserved sampling frequency index {}",
                               aac.frequencyIndex);
        if (aac.channels == 0)
            return "AAC channel configuration 0 cannot be written as ADTS, which has no room for a list of channels";
        if (aac.channels > 7)
            return fmt::format("AAC channel configuration {} cannot be written as ADTS, which has 1 to 7",
                               aac.channels);
        return {};
    }

    uint32_t m_fixed = 0; // the first 32 bits without the size; 0 until there is a configuration
};

// PCM as RIFF/WAVE. SoundFormat 0 uses the byte order of the machine that wrote it, in practice little-endian.
class Wav : public StreamFormat {
public:
    Wav(const flvdmx::AudioInfo& audio, uint32_t bits)
        : StreamFormat("wav"), m_channels(std::max(audio.channels, 1U)), m_rate(audio.sample_rate), m_bits(bits)
    {
    }

    Buffer Header(uint64_t bytes) const override
    {
        constexpr uint32_t AFTER_SIZE = 36; // bytes of the header after the size of the file
        constexpr uint32_t FORMAT_SIZE = 16;
        constexpr uint32_t PCM = 1;
        constexpr uint64_t MOST = std::numeric_limits<uint32_t>::max() - AFTER_SIZE; // more cannot be played
        const auto size = static_cast<uint32_t>(std::min(bytes, MOST));
        const uint32_t frame = m_channels * m_bits / 8;
        Buffer header;
        AppendName(header, "RIFF");
        AppendLittleEndian(header, size + AFTER_SIZE, 4);
        AppendName(header, "WAVEfmt ");
        AppendLittleEndian(header, FORMAT_SIZE, 4);
        AppendLittleEndian(header, PCM, 2);
        AppendLittleEndian(header, m_channels, 2);
        AppendLittleEndian(header, m_rate, 4);
        AppendLittleEndian(header, m_rate * frame, 4);
        AppendLittleEndian(header, frame, 2);
        AppendLittleEndian(header, m_bits, 2);
        AppendName(header, "data");
        AppendLittleEndian(header, size, 4);
        return header;
    }

private:
    static void AppendName(Buffer& out, std::string_view name) { out.insert(out.end(), name.begin(), name.end()); }

    const uint32_t m_channels;
    const uint32_t m_rate; // Hz
    const uint32_t m_bits; // per sample
};

class Raw : public StreamFormat {
public:
    using StreamFormat::StreamFormat;
    bool IsRaw() const override { return true; }
};

// AVC as Annex B, AAC as ADTS, PCM as WAV, MP3 unchanged, others raw.
std::unique_ptr<StreamFormat> FormatOf(const Input& input, flvdmx::Stream stream)
{
    if (stream == flvdmx::Stream::video) {
        if (input.info.video->codec == flvdmx::VideoCodec::avc)
            return std::make_unique<AnnexB>();
        return std::make_unique<Raw>("video");
    }
    switch (input.info.audio->codec) {
    case flvdmx::AudioCodec::aac:
        return std::make_unique<Adts>();
    case flvdmx::AudioCodec::mp3:
    case flvdmx::AudioCodec::mp3_8khz:
        return std::make_unique<StreamFormat>("mp3");
    case flvdmx::AudioCodec::pcm:
    case flvdmx::AudioCodec::pcm_little_endian:
        return std::make_unique<Wav>(*input.info.audio, input.PcmSampleSize());
    default:
        return std::make_unique<Raw>("audio");
    }
}

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
        if (const Buffer header = m_format->Header(written); !header.empty())
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
        const Buffer header = m_format->Header(std::numeric_limits<uint64_t>::max());
        m_out->Write(header.data(), header.size());
    }

    const std::string m_file;
    const flvdmx::Stream m_stream;
    std::unique_ptr<StreamFormat> m_format;
    std::unique_ptr<OutputFile> m_out;
    Buffer m_bytes;
    uint64_t m_frames = 0;
    const char* m_fault = "";
    uint64_t m_faults = 0;
    int64_t m_firstFault = 0;
};

std::vector<StreamWriter> MakeWriters(const ExtractOptions& options, const Input& input)
{
    std::vector<StreamWriter> writers;
    RequireStream(input, options.streams);
    for (const flvdmx::Stream stream : STREAMS)
        if (input.Has(stream) && (options.streams & static_cast<uint32_t>(stream)) != 0)
            writers.emplace_back(input, stream);
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
    ReadProgress progress(options.file, input.info.size);
    for (StreamWriter& writer : writers)
        writer.Open(options, writers.size() > 1);
    input.file.accept_all_times();
    Played played(input);
    while (const std::optional<flvdmx::Frame> frame = NextFrame(input)) {
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
