// Which tags of a file are played, and why the others are not.
#ifndef FLVDMX_TOOLS_PLAYED_H
#define FLVDMX_TOOLS_PLAYED_H

#include <array>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>

#include "tools/input.h"
#include "tools/tags.h"

namespace tool {

/** Goes through a file without reading its frames. Counts the bytes that are not played. */
class Played {
public:
    /** @param input borrowed; its own position does not change */
    explicit Played(const Input& input, TagReader::Progress progress = {});

    TagReader& Reader() { return m_reader; }

    /** Calls `see` with each tag that is played, script data and codec configurations included, until it returns
     *  false. */
    void Walk(const std::function<bool(const Tag&)>& see);

    /** For commands that play the file: counts what was skipped before a frame. Call it with every frame, in file
     *  order. */
    void Take(const flvdmx::Frame& frame);
    /** The same for what was skipped after the last frame. */
    void Finish() { Inspect(m_input.Instance().data_end); }

    int64_t BytesSkipped() const { return m_damage.bytes + m_unplayed.bytes; } /**< so far */
    /** Warns on standard error about what was skipped. */
    void Warn() const;

    /** @return true if a part is not played, and then counts it */
    bool CountIfSkipped(const Part& part);

    /** @return why a valid tag is not played, such as "it is too short for a frame"; empty if it is played */
    std::string WhyNot(const Tag& tag);

    /** @return why no frame of that stream is delivered, judging by its first tag; empty if the input has the stream,
     * or if no such tag was found */
    const std::string& WhyNoStream(flvdmx::Stream stream);

private:
    struct Loss {
        int64_t bytes = 0;
        int64_t first = 0; // position
        std::string why{}; // of the first tag

        void Add(const Part& part, const std::string& reason);
    };

    void Inspect(int64_t end);
    std::string WhyNotInStream(const Tag& tag) const;

    const Input& m_input;
    TagReader m_reader;
    int64_t m_end;                                        // of the last frame
    Loss m_damage;                                        // bytes outside valid tags
    Loss m_unplayed;                                      // valid tags that are not played
    std::array<std::optional<std::string>, 2> m_noStream; // the reasons, once they have been determined
};

/** @return the tag with which a stream could start, wherever it is: a valid configuration, or a tag of a codec that
 *          needs none; without configuration, the first AAC frame */
std::optional<Tag> FindStart(TagReader& reader, flvdmx::Stream stream);

/** @return true if a stream can start with this configuration */
bool IsValidConfig(flvdmx::Stream stream, flvdmx::Bytes config);

/** @return what is wrong with the first codec configurations of the input; empty if nothing */
std::string ConfigFault(const Input& input);

/** @return a text about a codec of the input that FLV does not define; empty if it defines all */
std::string UndefinedCodec(const Input& input);

/** @return FLVD_STREAM_* bits of the streams that the file header announces */
uint32_t AnnouncedStreams(TagReader& reader);

/** Throws FileError unless the input has one of these streams (FLVD_STREAM_* bits). */
void RequireStream(const Input& input, uint32_t streams);

/** Warns on standard error about those of these streams (FLVD_STREAM_* bits) that the file has but that are not played,
 *  and why. */
void WarnOfUnplayed(const Input& input, uint32_t streams = FLVD_STREAM_VIDEO | FLVD_STREAM_AUDIO);

/** @return true if a few sampled tags have times that only a restart explains; takes a few reads */
bool SeemsToRestart(const Input& input);

/** Warns on standard error if one time may occur at several positions in the file. */
void WarnOfRestarts(const Input& input);

/** @return why a file that the library rejected with this code cannot be played; empty if unknown */
std::string WhyNothingIsPlayed(const std::string& name, int32_t code);

} // namespace tool

#endif
