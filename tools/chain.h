// The chain of tags: does every tag follow the one before, and do back-pointers and timestamps agree?
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

/** What is still no fault. */
struct Limits {
    int64_t jumpMs;                    /**< largest step from one frame of a stream to the next */
    std::optional<int64_t> maxGapMs{}; /**< largest distance of keyframes, and of audio and video in the file */
};

/** Walks from the first tag to the end of the file. */
class Chain {
public:
    using Progress = std::function<void(int64_t position)>;

    /** @param reader, findings borrowed
     *  @param progress called often */
    Chain(const Input& input, TagReader& reader, Limits limits, Findings& findings, Progress progress);

    void Walk();
    /** Tags with a valid header, lost ones of damaged stretches not counted. */
    uint64_t Tags() const { return m_tags; }

private:
    struct Jump {
        Tag tag;
        int64_t from; // timestamp of the tag before it
    };

    // What was last seen of a stream.
    struct Lane {
        int64_t last = 0;            // timestamp
        std::optional<int64_t> time; // continuing after jumps
        std::optional<Jump> odd;     // the next tag tells whether it is a jump
        std::vector<uint8_t> config;
    };

    int64_t Step(int64_t position);
    void JudgePlayed(const Tag& tag);
    bool IsChained(const Tag& tag);
    bool CouldFollow(int64_t position);
    void TakeUnlinked(const Tag& tag, int64_t next);
    int64_t Resume(int64_t position, const std::optional<Tag>& tag);
    void AddRest(int64_t position, const std::optional<Tag>& tag);
    void Take(const Tag& tag);
    void JudgeConfig(const Tag& tag);
    void JudgeTime(const Tag& tag);
    void AddJump(const Jump& jump);
    void AddAlone(Lane& lane);
    void JudgeKeyframes(int64_t position, int64_t time);
    void JudgeGaps(const Tag& tag);
    Lane& LaneOf(const Tag& tag) { return tag.IsVideo() ? m_video : m_audio; }

    TagReader& m_reader;
    const Limits m_limits;
    Findings& m_findings;
    const Progress m_progress;
    const int64_t m_first; // position of the first tag
    uint64_t m_tags = 0;
    int64_t m_unlinkedEnd = -1;  // of the last tag without a valid back-pointer
    std::string m_unlinkedCause; // of the tags without one that follow each other
    Times m_times;
    std::optional<Jump> m_jump{}; // the last one
    std::string m_jumpCause;
    std::optional<int64_t> m_keyframe; // time of the last one, at first of the first video frame
    Lane m_video;
    Lane m_audio;
};

/** Adds what is wrong with the keyframe index of the metadata: entries that do not lead to a keyframe of about their
 *  time. */
void CheckIndex(const Input& input, TagReader& reader, Findings& findings);

} // namespace tool

#endif
