// The tags of a file, including what playing does not show: damage, and tags that are not played.
#ifndef FLVDMX_TOOLS_TAGS_H
#define FLVDMX_TOOLS_TAGS_H

#include <algorithm>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "flvdmx/layers.h"
#include "tools/input.h"
#include "tools/tag.h"

namespace tool {

/** Reads tags and bytes at any position of a file, with a separate reader. */
class TagReader {
public:
    /** @param input borrowed; its own position does not change */
    explicit TagReader(const Input& input);

    int64_t FileSize() const { return m_fileSize; }

    /** @return `size` bytes at `position`, valid until the next call; null if they are not all available */
    const uint8_t* Bytes(int64_t position, uint32_t size);

    /** @return the tag at `position`; nothing if its type is unknown or its header cut short */
    std::optional<Tag> At(int64_t position);

    /**
     * Finds the first valid tag of the file's streams at or after `from`, after any amount of damage. One search of the
     * library covers a limited range; it is repeated while the reader advances and has not reached `end`.
     *
     * @param progress called with the position after each search that found no tag
     */
    std::optional<Tag> Find(int64_t from, int64_t end, const std::function<void(int64_t)>& progress = {});

    /** @return the first valid configuration of a stream, wherever it is; nothing for a codec without one */
    std::optional<Tag> FindConfig(flvdmx::Stream stream);

    /** @return the bytes of a configuration after the codec header, valid until the next call; empty when Bytes() does
     *          not show all of them: they are a few dozen */
    flvdmx::Bytes ConfigBytes(const Tag& tag);

    /** @return FLVD_STREAM_* bits of the streams that the file header announces */
    uint32_t AnnouncedStreams();

    /** @return why a valid tag is not played, such as "it is too short for a frame"; empty if it is played */
    std::string WhyNotPlayed(const Tag& tag);

    /** @return why no frame of that stream is delivered, judging by its first tag; empty if the input has the stream,
     * or if no such tag was found */
    const std::string& WhyNoStream(flvdmx::Stream stream);

private:
    std::string WhyNotInStream(const Tag& tag);

    struct Closer {
        void operator()(fio_file_t* reader) const { __FLV_DMX__fioClose(reader); }
    };
    const Input& m_input;
    flvd_ctx_t* const m_instance;
    const std::unique_ptr<fio_file_t, Closer> m_reader;
    int64_t m_fileSize = 0;
    std::optional<std::string> m_noVideo; // the reasons, once they have been determined
    std::optional<std::string> m_noAudio;
};

/** @return what is wrong with the first codec configurations of the input; empty if nothing */
std::string ConfigFault(const Input& input);

/** @return a text about a codec of the input that FLV does not define; empty if it defines all */
std::string UndefinedCodec(const Input& input);

/** Warns on standard error about those of these streams (FLVD_STREAM_* bits) that the file has but that are not played,
 *  and why. */
void WarnOfUnplayed(const Input& input, uint32_t streams = FLVD_STREAM_VIDEO | FLVD_STREAM_AUDIO);

/** Finds the bytes that are skipped between the frames of a file. */
class Losses {
public:
    /** @param input borrowed
     *  @param script called with each script tag between frames; may be empty */
    explicit Losses(const Input& input, std::function<void(const Tag&)> script = {});

    /** Call it with every frame of the file, in file order. @return true if bytes were skipped before it */
    bool Take(const flvdmx::Frame& frame);
    /** Call it after the last frame. */
    void Finish() { Inspect(m_end, m_input.Instance().data_end); }

    int64_t Bytes() const { return m_bytes; } /**< skipped so far */
    /** @return the number of bytes after the last frame or the end of the valid data, whichever is later */
    int64_t Rest() const
    {
        return std::max(m_input.info.size - std::max(m_end, m_input.Instance().data_end), int64_t{0});
    }
    /** Warns on standard error about what was skipped. */
    void Warn() const;

private:
    struct Loss {
        int64_t bytes = 0;
        int64_t first = 0; // position
        std::string why{}; // of the first tag
    };

    int64_t EndOf(const flvdmx::Frame& frame);
    void Inspect(int64_t from, int64_t to);
    void Lose(int64_t from, int64_t to);

    const Input& m_input;
    const std::function<void(const Tag&)> m_script;
    TagReader m_reader;
    int64_t m_end;
    int64_t m_bytes = 0;
    Loss m_damage;   // bytes outside valid tags
    Loss m_unplayed; // valid tags that are not played
};

} // namespace tool

#endif
