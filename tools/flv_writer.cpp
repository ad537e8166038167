// Writes FLV files.
#include "tools/flv_writer.h"

#include <algorithm>
#include <array>
#include <cstring>
#include <iterator>
#include <utility>

#include "flvdmx/layers.h"
#include "flvdmx/metadata.hpp"
#include "tools/tags.h"

namespace tool {

namespace {

using Buffer = std::vector<uint8_t>;
using flvdmx::Amf0;
using flvdmx::Bytes;

constexpr size_t FILE_HEADER_SIZE = 9;
constexpr uint8_t HAS_AUDIO = 4; // TypeFlags
constexpr uint8_t HAS_VIDEO = 1;
constexpr size_t INDEX_MAX = 65536; // entries; with more keyframes, every nth one is listed
constexpr double MS_PER_SECOND = 1000;

constexpr int MAX_DEPTH = 16;

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

Buffer TagHeader(uint8_t type, size_t dataSize, uint32_t timestamp)
{
    Buffer header = {type};
    PutInteger(header, dataSize, 3);
    PutInteger(header, timestamp & 0xFFFFFF, 3);
    PutInteger(header, timestamp >> 24, 1);
    PutInteger(header, 0, 3); // StreamID
    return header;
}

// Skips AMF0 values. After one that is damaged or cut short, every call fails.
class ScriptReader : private Amf0 {
public:
    explicit ScriptReader(Bytes bytes) : m_bytes(bytes) {}

    const uint8_t* Position() const { return m_bytes.data() + m_position; }

    bool Skip(uint64_t size)
    {
        m_failed = m_failed || size > m_bytes.size() - m_position;
        m_position += m_failed ? 0 : static_cast<size_t>(size);
        return !m_failed;
    }

    uint64_t Integer(size_t size)
    {
        const uint8_t* const bytes = Position();
        uint64_t value = 0;
        if (Skip(size))
            for (size_t i = 0; i < size; ++i)
                value = value << 8 | bytes[i];
        return value;
    }

    bool Key(std::string& key)
    {
        const auto size = static_cast<uint32_t>(Integer(2));
        const uint8_t* const text = Position();
        if (Skip(size))
            key.assign(text, text + size);
        return !m_failed;
    }

    // Live servers store the command that set the metadata before the name.
    bool MetadataName()
    {
        std::string name;
        const auto next = [&] { return Integer(1) == Amf0::string && Key(name); };
        return next() && (name != "@setDataFrame" || next()) && name == "onMetaData";
    }

    bool SkipValue(int depth = 0)
    {
        if (depth > MAX_DEPTH)
            return false;
        switch (Integer(1)) {
        case number:
            return Skip(sizeof(double));
        case boolean:
            return Skip(1);
        case string:
            return Skip(Integer(2));
        case reference:
            return Skip(2);
        case long_string:
        case xml_document:
            return Skip(Integer(4));
        case date:
            return Skip(sizeof(double) + 2);
        case typed_object:
            return Skip(Integer(2)) && SkipMembers(depth);
        case ecma_array:
            return Skip(4) && SkipMembers(depth);
        case object:
            return SkipMembers(depth);
        case strict_array:
            return SkipElements(depth);
        case null:
        case undefined:
        case unsupported:
            return !m_failed;
        default:
            return false;
        }
    }

private:
    bool SkipMembers(int depth)
    {
        std::string key;
        while (Key(key)) {
            if (key.empty() && Position() != m_bytes.end() && *Position() == Amf0::object_end)
                return Skip(1);
            if (!SkipValue(depth + 1))
                return false;
        }
        return false;
    }

    bool SkipElements(int depth)
    {
        for (uint64_t count = Integer(4); count != 0; --count)
            if (!SkipValue(depth + 1))
                return false;
        return !m_failed;
    }

    const Bytes m_bytes;
    size_t m_position = 0;
    bool m_failed = false;
};

} // namespace

bool IsMetadata(Bytes payload)
{
    return ScriptReader(payload).MetadataName();
}

std::vector<ScriptProperty> ReadScriptProperties(Bytes payload)
{
    std::vector<ScriptProperty> properties;
    ScriptReader reader(payload);
    std::string key;
    if (!reader.MetadataName())
        return properties;
    const uint64_t marker = reader.Integer(1);
    if (marker != Amf0::object && (marker != Amf0::ecma_array || !reader.Skip(4)))
        return properties;
    while (reader.Key(key) && !key.empty()) {
        const uint8_t* const value = reader.Position();
        if (!reader.SkipValue())
            break;
        properties.push_back({key, Buffer(value, reader.Position())});
    }
    return properties;
}

ScriptProperty NumberProperty(std::string_view name, double value)
{
    ScriptProperty property = {std::string(name), {}};
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
    m_size += TAG_HEADER_SIZE + tag.header.size() + tag.payload.size() + BACK_POINTER_SIZE;
}

ScriptProperty FlvLayout::Index(uint64_t firstTag) const
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
    ScriptProperty index = {"keyframes", {Amf0::object}};
    PutKey(index.value, "times");
    Put(index.value, times);
    PutKey(index.value, "filepositions");
    Put(index.value, positions);
    PutObjectEnd(index.value);
    return index;
}

std::vector<uint8_t> FlvLayout::ScriptPayload(const std::vector<ScriptProperty>& properties, uint64_t firstTag) const
{
    std::vector<ScriptProperty> all;
    std::copy_if(properties.begin(), properties.end(), std::back_inserter(all), [](const ScriptProperty& property) {
        return std::find(DROPPED.begin(), DROPPED.end(), property.name) == DROPPED.end();
    });
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
    for (const ScriptProperty& property : all) {
        PutKey(payload, property.name);
        Put(payload, property.value);
    }
    PutObjectEnd(payload);
    return payload;
}

std::vector<uint8_t> FlvLayout::Beginning(const std::vector<ScriptProperty>& properties) const
{
    Buffer out = {'F', 'L', 'V', 1}; // signature, version
    out.push_back(static_cast<uint8_t>((m_hasAudio ? HAS_AUDIO : 0) | (m_hasVideo ? HAS_VIDEO : 0)));
    PutInteger(out, FILE_HEADER_SIZE, 4);
    PutInteger(out, 0, BACK_POINTER_SIZE);                   // PreviousTagSize0
    const size_t size = ScriptPayload(properties, 0).size(); // does not depend on the positions
    const uint64_t firstTag = out.size() + TAG_HEADER_SIZE + size + BACK_POINTER_SIZE;
    Put(out, TagHeader(FLVD_TAG_TYPE_SCRIPT, size, 0));
    Put(out, ScriptPayload(properties, firstTag));
    PutInteger(out, TAG_HEADER_SIZE + size, BACK_POINTER_SIZE);
    return out;
}

void WriteTag(OutputFile& file, const NewTag& tag)
{
    const size_t dataSize = tag.header.size() + tag.payload.size();
    Buffer header = TagHeader(tag.type, dataSize, tag.timestamp);
    header.insert(header.end(), tag.header.begin(), tag.header.end());
    file.Write(header.data(), header.size());
    file.Write(tag.payload.data(), tag.payload.size());
    Buffer backPointer;
    PutInteger(backPointer, TAG_HEADER_SIZE + dataSize, BACK_POINTER_SIZE);
    file.Write(backPointer.data(), backPointer.size());
}

} // namespace tool
