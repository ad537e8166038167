// The chain of tags: does every tag follow the previous one, and do back-pointers and timestamps agree?
#ifndef FLVDMX_TOOLS_CHAIN_H
#define FLVDMX_TOOLS_CHAIN_H

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "tools/findings.h"
#include "tools/input.h"
#include "tools/tags.h"
#include "tools/times.h"

namespace tool {

/** The largest values that are not reported. */
struct Limits {
    int64_t jumpMs;                    /**< largest step from one frame of a stream to the next */
    std::optional<int64_t> maxGapMs{}; /**< largest distance of keyframes, and of audio and video in the file */
};

/** Scans a file from the first tag to the end. */
class Chain {
public:
    using Progress = std::function<void(int64_t position)>;

    /** @param reader, findings borrowed
     *  @param progress called with the position reached, once per tag or search */
    Chain(const Input& input, TagReader& reader, Limits limits, Findings& findings, Progress progress);

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

    int64_t Step(int64_t position);
    void CheckPlayed(const Tag& tag);
    bool IsChained(const Tag& tag);
    bool CouldFollow(int64_t position);
    void TakeUnlinked(const Tag& tag, int64_t next);
    int64_t Resume(int64_t position, const std::optional<Tag>& tag);
    void AddRest(int64_t position, const std::optional<Tag>& tag);
    void Take(const Tag& tag);
    void CheckConfig(const Tag& tag);
    void CheckTime(const Tag& tag);
    void AddJump(const Jump& jump);
    void AddAlone(Lane& lane);
    void CheckKeyframes(int64_t position, int64_t time);
    void CheckGaps(const Tag& tag);
    Lane& LaneOf(const Tag& tag) { return tag.IsVideo() ? m_video : m_audio; }

    TagReader& m_reader;
    const Limits m_limits;
    Findings& m_findings;
    const Progress m_progress;
    const int64_t m_first; // position of the first tag
    uint64_t m_tags = 0;
    int64_t m_unlinkedEnd = -1;  // of the last tag without a valid back-pointer
    std::string m_unlinkedCause; // shared by consecutive ones
    Times m_times;
    std::optional<Jump> m_jump{}; // the last one
    std::string m_jumpCause;
    std::optional<int64_t> m_keyframe; // time of the last one; before the first, time of the first video frame
    Lane m_video;
    Lane m_audio;
};

/** Adds findings about the keyframe index in the metadata: entries that do not point to a keyframe at about their
 *  time. */
void CheckIndex(const Input& input, TagReader& reader, Findings& findings);

} // namespace tool

#endif
