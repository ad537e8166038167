// Checks codec headers against a second implementation: audio headers, AVC records, picture headers.

#include "harness.h"

#include <cstring>

using namespace flvd_fuzz;

namespace {

// Returns the first MPEG audio frame header, or 0.
uint32_t find_mpeg(const Bytes& data)
{
    for (size_t at = 0; at + 4 <= data.size(); ++at) {
        const uint32_t header = read_be(data.data() + at, 4);
        const bool reserved = (header >> 19u & 3u) == 1 || (header >> 17u & 3u) == 0 || (header >> 10u & 3u) == 3;
        if (header >> 21u == 0x7FF && !reserved)
            return header;
    }
    return 0;
}

// The control byte is the SoundFormat.
void run_audio(Input& input)
{
    const Bytes& data = input.payload();
    const int32_t format = input.byte();
    const uint32_t header = format == 2 || format == 14 ? find_mpeg(data) : 0;
    flvd_audio_info_t info{};
    const int32_t rc = FLVD_ParseAudioHeader(format, data.data(), static_cast<int32_t>(data.size()), &info);
    require(rc == (format == 10 || header != 0 ? 0 : -1), "wrong result");
    require(header == 0 || info.channels == ((header >> 6u & 3u) == 3 ? 1u : 2u), "wrong number of channels");
    require(header == 0 || info.data_rate <= 448, "impossible data rate");
    if (rc == 0)
        info.sample_rate = info.channels = 0;
    if (header != 0)
        info.sample_size = info.format_tag = info.data_rate = 0;
    require(bytes_of(info) == Bytes(sizeof info), "parsing an audio header changed other fields");
}

// The record's parameter sets with start codes; empty if the record ends too early.
Bytes parameter_sets(const Bytes& record)
{
    Bytes sets;
    size_t at = 5;
    for (const uint8_t mask : {uint8_t{0x1F}, uint8_t{0xFF}}) {
        if (record.size() < std::max<size_t>(at + 1, 7) || record[0] != 1)
            return {};
        for (int32_t count = record[at++] & mask; count > 0; --count) {
            const size_t begin = at + 2;
            at = begin <= record.size() ? begin + read_be(record.data() + at, 2) : begin;
            if (at > record.size())
                return {};
            Append(sets, Concat({{0, 0, 0, 1}, Bytes(record.data() + begin, record.data() + at)}));
        }
    }
    return sets;
}

void check_picture(int32_t codec, const Bytes& data)
{
    flvd_video_info_t info{};
    const int32_t rc = FLVD_ParseVideoHeader(codec, data.data(), static_cast<int32_t>(data.size()), &info);
    const bool known = codec == 2 || codec == 4 || codec == 5 || codec == 7;
    require(rc == -1 || (rc == 0 && known && data.size() >= 8), "found a picture header in data that has none");
    if (rc == 0)
        info.width = info.height = 0;
    if (rc == 0 && codec == 7)
        std::memset(info.fourcc, 0, sizeof info.fourcc);
    require(bytes_of(info) == Bytes(sizeof info), "parsing a picture header changed other fields");
}

// The control bytes are the codec of a picture header and the capacity for parameter sets, in units of 4 bytes.
void run_avc(Input& input)
{
    const Bytes& record = input.payload();
    const int32_t codec = input.byte();
    Bytes out(size_t{input.byte()} * 4);
    const Bytes expected = parameter_sets(record);
    const int32_t written = FLVD_GetAVCSeqHeaderFromAvcC(record.data(), static_cast<int32_t>(record.size()), out.data(),
                                                         static_cast<int32_t>(out.size()));
    require(static_cast<size_t>(written) == (expected.size() <= out.size() ? expected.size() : 0),
            "wrong size of the parameter sets");
    out.resize(static_cast<size_t>(written));
    require(written == 0 || out == expected, "wrong parameter sets");
    check_picture(codec, record);
    check_picture(7, out);
}

const Target g_audio("audio", run_audio), g_avc("avc", run_avc);

} // namespace
