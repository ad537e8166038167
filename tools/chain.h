// The chain of tags: does every tag follow the one before, and do back-pointers and timestamps agree?
#ifndef FLVDMX_TOOLS_CHAIN_H
#define FLVDMX_TOOLS_CHAIN_H

#include <cstdint>
#include <functional>
#include <optional>
#include <string_view>

#include "tools/demuxer.h"
#include "tools/findings.h"
#include "tools/tags.h"

namespace tool {

/** Reads single tags and numbers anywhere in the file. */
class TagProbe {
public:
    /** @param demuxer borrowed; its main reader is used */
    explicit TagProbe(const Demuxer& demuxer);

    int64_t FileSize() const { return m_fileSize; }

    /** @return up to `size` bytes at `position`, valid until the next call; null when not all of them are there */
    const uint8_t* Bytes(int64_t position, uint32_t size) const;

    /** @return what stands at `position` when it has the type of a tag and is not cut in its header */
    std::optional<Tag> At(int64_t position) const;

private:
    fio_file_t* m_reader;
    int64_t m_fileSize;
};

/** Walks from the first tag to the end of the file. */
class Chain {
public:
    using Progress = std::function<void(int64_t position)>;

    /** @param demuxer, probe, findings borrowed
     *  @param jumpMs largest step from one frame of a stream to the next that is no jump
     *  @param progress called often */
    Chain(const Demuxer& demuxer, const TagProbe& probe, uint32_t jumpMs, Findings& findings, Progress progress);

    void Walk();
    uint64_t Tags() const
    {
        return m_tags;
    } /**< tags with a sound header, lost ones of damaged stretches not counted */

private:
    int64_t Step(int64_t position);
    std::string_view WhyPassedOver(const Tag& tag) const;
    void JudgePlayed(const Tag& tag);
    bool IsChained(const Tag& tag) const;
    bool CouldFollow(int64_t position) const;
    void TakeUnlinked(const Tag& tag, int64_t next);
    int64_t Resume(int64_t position, const std::optional<Tag>& tag);
    void AddRest(int64_t position, const std::optional<Tag>& tag);
    void Take(const Tag& tag);

    flvd_ctx_t* m_instance;
    fio_file_t* m_reader;
    const uint32_t m_streams;
    const TagProbe& m_probe;
    const uint32_t m_jumpMs;
    Findings& m_findings;
    const Progress m_progress;
    const int64_t m_first; // position of the first tag
    uint64_t m_tags = 0;
    std::string_view m_passedOver; // why the audio or video tag before was
    std::optional<uint32_t> m_lastTimes[FLVD_STREAM_AUDIO + 1];
};

} // namespace tool

#endif
