/*
 * The metadata of a file, as returned by flvdmx::File::metadata(): the properties of its script data, parsed as AMF0
 * ("Action Message Format, AMF 0"). For C++17.
 */
#ifndef FLVDMX_METADATA_HPP
#define FLVDMX_METADATA_HPP

#include "flvdmx/result.hpp"

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

namespace flvdmx {

/** Type markers of script data ("Action Message Format, AMF 0", 2.1). Each value starts with one. */
struct Amf0 {
    static constexpr uint8_t number = 0;        /**< a double, 8 bytes */
    static constexpr uint8_t boolean = 1;       /**< 1 byte */
    static constexpr uint8_t string = 2;        /**< length in 2 bytes, UTF-8 */
    static constexpr uint8_t object = 3;        /**< members, up to object_end */
    static constexpr uint8_t null = 5;          /**< no data */
    static constexpr uint8_t undefined = 6;     /**< no data */
    static constexpr uint8_t reference = 7;     /**< number of an earlier object in 2 bytes */
    static constexpr uint8_t ecma_array = 8;    /**< count in 4 bytes, members, up to object_end */
    static constexpr uint8_t object_end = 9;    /**< after the empty name that ends members */
    static constexpr uint8_t strict_array = 10; /**< count in 4 bytes, values */
    static constexpr uint8_t date = 11;         /**< a double, ms since 1970, and the time zone in 2 bytes */
    static constexpr uint8_t long_string = 12;  /**< length in 4 bytes, UTF-8 */
    static constexpr uint8_t unsupported = 13;  /**< no data */
    static constexpr uint8_t xml_document = 15; /**< like long_string */
    static constexpr uint8_t typed_object = 16; /**< name of the class, members, up to object_end */
};

/** A date in the metadata. */
struct Date {
    double milliseconds = 0;  /**< since 1 January 1970 UTC, as in the file; may be NaN or infinite */
    int16_t zone_minutes = 0; /**< time zone as in the file, usually 0; not included in `milliseconds` */
};

/** One property. */
struct Property {
    std::string name;                                    /**< nested names are joined by dots: "cuePoints.0.name" */
    std::variant<double, bool, std::string, Date> value; /**< strings are UTF-8 if the file follows the format */
};

/** One property with its value as in the file, for programs that write the metadata to another file. */
struct RawProperty {
    std::string name;           /**< not joined with others */
    std::vector<uint8_t> value; /**< AMF0, from its type marker on */
};

/**
 * Properties in file order: title, creator, encoder and the like. Names of properties of "onMetaData" are used as they
 * are; those of other script data are prefixed with the name of that data. Array elements are numbered from 0. The
 * keyframe index is not included: see File::keyframes().
 *
 * For any file, there are at most 1000 properties, 16 levels deep, with at most 1 MiB of names and strings, among at
 * most a million values. Everything beyond that is dropped.
 */
class Metadata {
public:
    static constexpr size_t max_properties = 1000; /**< most properties kept */
    static constexpr size_t max_text = 1u << 20;   /**< most bytes of names and strings kept */
    static constexpr size_t max_values = 1000000;  /**< most values read, those that are not kept included */
    static constexpr int max_depth = 16;           /**< most levels of nested objects and arrays */

    std::vector<Property>::const_iterator begin() const& { return m_properties.begin(); } /**< the first property */
    std::vector<Property>::const_iterator end() const& { return m_properties.end(); }     /**< past the last property */
    std::vector<Property>::const_iterator begin() const&& = delete; /**< deleted: the result would dangle */
    std::vector<Property>::const_iterator end() const&& = delete;   /**< deleted: the result would dangle */
    size_t size() const { return m_properties.size(); }             /**< number of properties */

    /** @return the first property with that name, or null; valid while the Metadata lives */
    const Property* find(std::string_view name) const&
    {
        for (const Property& property : m_properties)
            if (property.name == name)
                return &property;
        return nullptr;
    }

    const Property* find(std::string_view name) const&& = delete; /**< deleted: the result would dangle */

    /** @return a copy of the string property with that name; empty when there is none or it is not a string */
    std::string text(std::string_view name) const
    {
        const Property* const property = find(name);
        const auto* const value = property != nullptr ? std::get_if<std::string>(&property->value) : nullptr;
        return value != nullptr ? *value : std::string();
    }

    /** Adds the properties of one script tag, up to the first value that is damaged or cut short. */
    void add_script_data(Bytes payload)
    {
        Reader reader(*this, payload);
        while (reader.read_event())
            ;
    }

    /**
     * Copies the properties of "onMetaData" without interpretation, the keyframe index included, up to the first one
     * that is damaged or cut short. To write them: the string "onMetaData", the marker and count of an ECMA array, each
     * name (its length in 2 bytes, then its bytes) and value, an empty name and object_end.
     *
     * @param payload of a script tag
     * @return the properties in file order; nothing if this is other script data
     */
    static std::optional<std::vector<RawProperty>> copy_properties(Bytes payload)
    {
        Metadata unused;
        return Reader(unused, payload).copy_properties();
    }

private:
    // Parses AMF0 values. Anything that cannot be parsed ends the payload.
    class Reader : private Amf0 {
    public:
        Reader(Metadata& metadata, Bytes payload) : m_metadata(metadata), m_rest(payload) {}

        // Reads one top-level value. A string there is the name of the values that follow.
        bool read_event()
        {
            if (m_rest[0] != string)
                return read_value(0);
            take(1);
            m_name = take_text(2);
            if (m_name == "onMetaData")
                m_name.clear();
            return !m_failed;
        }

        std::optional<std::vector<RawProperty>> copy_properties()
        {
            std::string_view event;
            do { // live servers store the command that sets the metadata before its name
                if (take(1)[0] != string)
                    return std::nullopt;
                event = take_text(2);
            } while (event == "@setDataFrame");
            if (event != "onMetaData")
                return std::nullopt;
            std::vector<RawProperty> list;
            m_skips = true;
            const uint8_t marker = take(1)[0];
            if (marker != object && (marker != ecma_array || !pass(4)))
                return list;
            for (std::string_view key = take_text(2); !key.empty(); key = take_text(2)) {
                const uint8_t* const value = m_rest.begin();
                if (!read_value(1))
                    break;
                list.push_back({std::string(key), {value, m_rest.begin()}});
            }
            return list;
        }

    private:
        // Takes the next bytes. When there are fewer, returns none and ends the payload.
        Bytes take(size_t size)
        {
            m_failed = m_failed || size > m_rest.size();
            const Bytes taken(m_rest.data(), m_failed ? 0 : size);
            m_rest = m_failed ? Bytes() : Bytes(m_rest.data() + size, m_rest.size() - size);
            return taken;
        }

        uint64_t take_integer(size_t size)
        {
            uint64_t value = 0;
            for (const uint8_t byte : take(size))
                value = value << 8 | byte;
            return value;
        }

        double take_number()
        {
            const uint64_t bits = take_integer(sizeof(double));
            double value = 0;
            static_assert(sizeof value == sizeof bits);
            std::memcpy(&value, &bits, sizeof value);
            return value;
        }

        Date take_date()
        {
            const double milliseconds = take_number();
            return {milliseconds, static_cast<int16_t>(take_integer(2))};
        }

        // Takes a string preceded by its length, a number of 2 or 4 bytes.
        std::string_view take_text(size_t length_size)
        {
            const Bytes text = take(static_cast<uint32_t>(take_integer(length_size)));
            return {reinterpret_cast<const char*>(text.data()), text.size()};
        }

        bool keep_text(size_t length_size)
        {
            const std::string_view text = take_text(length_size);
            return keep(std::string(text), text.size());
        }

        // Adds a property. False at a limit, which ends the payload as well.
        template <typename Value> bool keep(Value value, size_t text_size = 0)
        {
            if (m_failed || m_skips)
                return !m_failed;
            const size_t size = m_name.size() + text_size;
            if (m_metadata.size() == max_properties || size > max_text - m_metadata.m_text)
                return false;
            m_metadata.m_text += size;
            m_metadata.m_properties.push_back({m_name, std::move(value)});
            return true;
        }

        bool pass(size_t size)
        {
            take(size);
            return !m_failed;
        }

        bool read_member(std::string_view key, int depth)
        {
            const size_t outer = m_name.size();
            if (outer != 0)
                m_name += '.';
            m_name.append(key);
            const bool read = read_value(depth);
            m_name.resize(outer);
            return read;
        }

        // Reads members up to an empty name followed by the end marker.
        bool read_object(int depth)
        {
            while (!m_failed) {
                const std::string_view key = take_text(2);
                if (key.empty() && m_rest[0] == object_end)
                    return pass(1);
                if (!read_member(key, depth))
                    return false;
            }
            return false;
        }

        bool read_array(int depth)
        {
            const uint64_t count = take_integer(4);
            for (uint64_t i = 0; i < count; ++i)
                if (!read_member(std::to_string(i), depth))
                    return false;
            return !m_failed;
        }

        bool read_members(uint8_t marker, int depth)
        {
            if (marker == strict_array)
                return read_array(depth);
            if (marker == ecma_array)
                take(4); // the count, which is not reliable
            if (marker == typed_object)
                take_text(2);
            return read_object(depth);
        }

        bool read_container(uint8_t marker, int depth)
        {
            if (depth == max_depth)
                return false;
            const bool skipped = std::exchange(m_skips, m_skips || m_name == "keyframes"); // skip thousands of numbers
            const bool read = read_members(marker, depth + 1);
            m_skips = skipped;
            return read;
        }

        bool read_value(int depth)
        {
            const Bytes marker = take(1);
            if (m_failed || ++m_metadata.m_values > max_values)
                return false;
            switch (marker[0]) {
            case number:
                return keep(take_number());
            case boolean:
                return keep(take_integer(1) != 0);
            case string:
                return keep_text(2);
            case long_string:
            case xml_document:
                return keep_text(4);
            case date:
                return keep(take_date());
            case object:
            case ecma_array:
            case strict_array:
            case typed_object:
                return read_container(marker[0], depth);
            case reference:
                return pass(2);
            case null:
            case undefined:
            case unsupported:
            case object_end:
                return true;
            default:
                return false;
            }
        }

        Metadata& m_metadata;
        Bytes m_rest;
        std::string m_name; // of the value being read, prefixed with those of its containers
        bool m_skips = false;
        bool m_failed = false;
    };

    std::vector<Property> m_properties;
    size_t m_text = 0;
    size_t m_values = 0;
};

} // namespace flvdmx

#endif /* FLVDMX_METADATA_HPP */
