// Writes FLV files.
#include "tools/flv_writer.h"

#include <algorithm>
#include <array>
#include <cstring>

#include "flvdmx/layers.h"
#include "tools/tags.h"

namespace tool {

namespace {

using Buffer = std::vector<uint8_t>;
using flvdmx::Amf0;

constexpr size_t FILE_HEADER_SIZE = 9;
constexpr uint8_t HAS_AUDIO = 4; // TypeFlags
constexpr uint8_t HAS_VIDEO = 1;
constexpr size_t MOST_PROPERTY_BYTES = 8 << 20; // copied from the old file: a tag has room for 16 MiB
constexpr size_t INDEX_MAX = 65536;             // entries; with more keyframes, every nth one is listed
constexpr double MS_PER_SECOND = 1000;

// Properties that are written anew, and others that describe the old file.
constexpr std::array<std::string_view, 11> DROPPED = {
    "duration", "filesize",  "lasttimestamp", "lastkeyframetimestamp", "keyframes",   "lastkeyframelocation",
    "datasize", "videosize", "audiosize",     "hasKeyframes",          "canSeekToEnd"};

void Put(Buffer& out, const Buffer& bytes)
{
    out.insert(out.end(), bytes.begin(), bytes.end());
}

void PutInteger(Buffer& out, uint64_t value, size_t size)
{
    while (size-- != 0)
        out.push_back(static_cast<uint8_t>(value >> 8 * size));
}

void PutNumber(Buffer& out, double value)
{
    uint64_t bits = 0;
    static_assert(sizeof bits == sizeof value);
    std::memcpy(&bits, &value, sizeof bits);
    out.push_back(Amf0::number);
    PutInteger(out, bits, sizeof bits);
}

void PutKey(Buffer& out, std::string_view key)
{
    PutInteger(out, key.size(), 2);
    out.insert(out.end(), key.begin(), key.end());
}

void PutObjectEnd(Buffer& out)
{
    PutKey(out, "");
    out.push_back(Amf0::object_end);
}

Buffer TagHeader(uint8_t type, size_t dataSize, uint32_t timestamp, uint32_t streamId = 0)
{
    Buffer header = {type};
    PutInteger(header, dataSize, 3);
    PutInteger(header, timestamp & 0xFFFFFF, 3);
    PutInteger(header, timestamp >> 24, 1);
    PutInteger(header, streamId, 3);
    return header;
}

} // namespace

flvdmx::RawProperty NumberProperty(std::string_view name, double value)
{
    flvdmx::RawProperty property = {std::string(name), {}};
    PutNumber(property.value, value);
    return property;
}

void FlvLayout::Add(const NewTag& tag)
{
    m_hasVideo = m_hasVideo || tag.type == FLVD_TAG_TYPE_VIDEO;
    m_hasAudio = m_hasAudio || tag.type == FLVD_TAG_TYPE_AUDIO;
    if (tag.keyframe)
        m_keyframes.push_back({tag.timestamp, m_size});
    if (tag.frame) {
        m_firstTimestamp = std::min(m_firstTimestamp, tag.timestamp);
        m_lastTimestamp = std::max(m_lastTimestamp, tag.timestamp);
    }
    m_size += Tag::header_size + tag.payload.size() + Tag::back_pointer_size;
}

flvdmx::RawProperty FlvLayout::Index(uint64_t firstTag) const
{
    const size_t step = (m_keyframes.size() + INDEX_MAX - 1) / INDEX_MAX;
    const size_t count = (m_keyframes.size() + step - 1) / step;
    Buffer times = {Amf0::strict_array};
    Buffer positions = {Amf0::strict_array};
    PutInteger(times, count, 4);
    PutInteger(positions, count, 4);
    for (size_t i = 0; i < m_keyframes.size(); i += step) {
        PutNumber(times, m_keyframes[i].timestamp / MS_PER_SECOND);
        PutNumber(positions, static_cast<double>(firstTag + m_keyframes[i].offset));
    }
    flvdmx::RawProperty index = {"keyframes", {Amf0::object}};
    PutKey(index.value, "times");
    Put(index.value, times);
    PutKey(index.value, "filepositions");
    Put(index.value, positions);
    PutObjectEnd(index.value);
    return index;
}

std::vector<uint8_t> FlvLayout::ScriptPayload(const std::vector<flvdmx::RawProperty>& properties,
                                              uint64_t firstTag) const
{
    std::vector<flvdmx::RawProperty> all;
    size_t size = 0;
    for (const flvdmx::RawProperty& property : properties) {
        const bool dropped = std::find(DROPPED.begin(), DROPPED.end(), property.name) != DROPPED.end();
        if (dropped || property.value.size() > MOST_PROPERTY_BYTES - size)
            continue;
        size += property.value.size();
        all.push_back(property);
    }
    all.push_back(NumberProperty("duration", Duration() / MS_PER_SECOND));
    all.push_back(NumberProperty("filesize", static_cast<double>(firstTag + m_size)));
    all.push_back(NumberProperty("lasttimestamp", m_lastTimestamp / MS_PER_SECOND));
    if (!m_keyframes.empty()) {
        all.push_back(NumberProperty("lastkeyframetimestamp", m_keyframes.back().timestamp / MS_PER_SECOND));
        all.push_back(Index(firstTag));
    }
    Buffer payload = {Amf0::string};
    PutKey(payload, "onMetaData");
    payload.push_back(Amf0::ecma_array);
    PutInteger(payload, all.size(), 4);
    for (const flvdmx::RawProperty& property : all) {
        PutKey(payload, property.name);
        Put(payload, property.value);
    }
    PutObjectEnd(payload);
    return payload;
}

std::vector<uint8_t> FlvLayout::Beginning(const std::vector<flvdmx::RawProperty>& properties) const
{
    Buffer out = {'F', 'L', 'V', 1}; // signature, version
    out.push_back(static_cast<uint8_t>((m_hasAudio ? HAS_AUDIO : 0) | (m_hasVideo ? HAS_VIDEO : 0)));
    PutInteger(out, FILE_HEADER_SIZE, 4);
    PutInteger(out, 0, Tag::back_pointer_size);              // PreviousTagSize0
    const size_t size = ScriptPayload(properties, 0).size(); // does not depend on the positions
    const uint64_t firstTag = out.size() + Tag::header_size + size + Tag::back_pointer_size;
    Put(out, TagHeader(FLVD_TAG_TYPE_SCRIPT, size, 0));
    Put(out, ScriptPayload(properties, firstTag));
    PutInteger(out, Tag::header_size + size, Tag::back_pointer_size);
    return out;
}

void WriteTag(OutputFile& file, const NewTag& tag)
{
    Buffer bytes = TagHeader(tag.type, tag.payload.size(), tag.timestamp, tag.streamId);
    Put(bytes, tag.payload);
    PutInteger(bytes, Tag::header_size + tag.payload.size(), Tag::back_pointer_size);
    file.Write(bytes.data(), bytes.size());
}

} // namespace tool
