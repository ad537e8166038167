// What a check finds in a file: does every tag follow the previous one, do back-pointers, timestamps and the keyframe
// index agree with it?
#ifndef FLVDMX_TOOLS_CHAIN_H
#define FLVDMX_TOOLS_CHAIN_H

#include <array>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "tools/input.h"
#include "tools/played.h"
#include "tools/report.h"
#include "tools/tags.h"
#include "tools/times.h"

namespace tool {

/** The largest values that are not reported. */
struct Limits {
    int64_t jumpMs;                    /**< largest step from one frame of a stream to the next */
    std::optional<int64_t> maxGapMs{}; /**< largest distance of keyframes, and of audio and video in the file */
};

/** One finding per cause, with a count. Only the first ones are kept, which limits the memory for a very damaged file.
 */
class Findings {
public:
    /**
     * @param kind   name of the kind, such as "gap"
     * @param cause  findings of one kind with the same cause are combined; empty: not combined with others
     * @param offset position in the file
     * @param text   description for people
     * @param more   further members for programs
     */
    void Add(const char* kind, const std::string& cause, int64_t offset, const std::string& text,
             const Json& more = Json::object());

    /** Adds something that is worth knowing but is not a fault. */
    void Note(const char* kind, const std::string& cause, int64_t offset, const std::string& text);

    /** Adds the members sound, lost_bytes, counts, findings, unlisted and notes.
     *  @param lost bytes that are not played */
    void WriteTo(Json& object, int64_t lost) const;

private:
    bool Enter(Json& list, const char* kind, const std::string& cause, int64_t offset, const std::string& text,
               const Json& more);

    uint64_t m_total = 0; // findings, combined ones counted once
    Json m_counts = Json::object();
    Json m_list = Json::array();
    Json m_notes = Json::array();
    std::map<std::string, size_t> m_causes; // index in its list
};

/** Scans a file from the first tag to the end. */
class Chain {
public:
    /** @param played, findings borrowed */
    Chain(Played& played, Limits limits, Findings& findings);

    void Walk();
    /** Number of tags with a valid header, without those inside damage. */
    uint64_t Tags() const { return m_tags; }

private:
    struct Jump {
        Tag tag;
        int64_t from; // timestamp of the previous tag of its stream
    };

    // The state of a stream.
    struct Lane {
        int64_t last = 0;            // timestamp of the last tag
        std::optional<int64_t> time; // of the last tag, continuous across jumps
        std::optional<Jump> odd;     // the next tag shows whether this is a jump
        std::vector<uint8_t> config;
    };

    void See(const Part& part);
    void AddSkipped(const Tag& tag);
    void AddUnlinked(const Part& part);
    void AddDamage(const Part& part);
    void Take(const Tag& tag);
    void CheckConfig(const Tag& tag);
    void CheckTime(const Tag& tag);
    void AddJump(const Jump& jump);
    void AddAlone(Lane& lane);
    void CheckKeyframes(int64_t position, int64_t time);
    void CheckGaps(const Tag& tag);
    Lane& LaneOf(const Tag& tag) { return m_lanes.at(IndexOf(tag.stream())); }

    Played& m_played;
    TagReader& m_reader;
    const Limits m_limits;
    Findings& m_findings;
    uint64_t m_tags = 0;
    int64_t m_unlinkedEnd = -1;  // of the last tag without a valid back-pointer
    std::string m_unlinkedCause; // shared by consecutive ones
    Times m_times;
    std::optional<Jump> m_jump{}; // the last one
    std::string m_jumpCause;
    std::optional<int64_t> m_keyframe; // time of the last one; before the first, time of the first video frame
    std::array<Lane, 2> m_lanes;       // video, audio
};

/** Adds findings about the keyframe index in the metadata: entries that do not point to a keyframe at about their
 *  time. */
void CheckIndex(const Input& input, TagReader& reader, Findings& findings);

} // namespace tool

#endif
