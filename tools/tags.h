// The tags of a file, read one after the other: what playing does not show.
#ifndef FLVDMX_TOOLS_TAGS_H
#define FLVDMX_TOOLS_TAGS_H

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "flvdmx/flvdmx.hpp"
#include "flvdmx/layers.h"

namespace tool {

using flvdmx::Tag;

/** @return the number in the `size` bytes at `bytes`, most significant first */
uint32_t BigEndian(const uint8_t* bytes, uint32_t size);

/** @return true for a video frame that can be decoded without earlier ones */
inline bool IsVideoKeyframe(const Tag& tag)
{
    return tag.is_video() && tag.has_frame() && tag.is_keyframe();
}

/** A part of a file. All parts together are the whole file. */
struct Part {
    enum class Kind {
        tag,      /**< a tag whose back-pointer agrees with it */
        unlinked, /**< a tag with a wrong back-pointer, or none: another tag follows, or it is the script data at the
                       beginning, which players trust */
        damage    /**< bytes that belong to no tag */
    } kind;
    int64_t begin; /**< position in the file */
    int64_t end;
    Tag tag; /**< with Kind::damage: what the bytes look like, for instance a tag that is cut short */

    int64_t Size() const { return end - begin; }
};

/** Reads tags and bytes at any position of a file, with a reader of its own. */
class TagReader {
public:
    /** Called with the position reached, once per part and once per search in a long damage. */
    using Progress = std::function<void(int64_t position)>;

    /** @param name     file, as the user named it; throws FileError if it cannot be opened
     *  @param instance the open file, borrowed; its own position does not change. Null: Walk() is not possible */
    explicit TagReader(const std::string& name, flvd_ctx_t* instance = nullptr, Progress progress = {});

    int64_t FileSize() const { return m_size; }

    /** @return the position of the first tag */
    int64_t FirstTag();

    /** @return `size` bytes at `position`, at most a few hundred, valid until the next call; null if they are not all
     *          in the file */
    const uint8_t* Bytes(int64_t position, uint32_t size);

    /** @return the payload of a tag; throws FileError */
    std::vector<uint8_t> Payload(const Tag& tag);

    /** @return the codec configuration in a tag; throws FileError */
    std::vector<uint8_t> Config(const Tag& tag);

    /** @return the tag at `position`; nothing if its type is unknown or its header cut short */
    std::optional<Tag> At(int64_t position);

    /** Calls `see` with each part between two positions, until it returns false. */
    void Walk(int64_t from, int64_t to, const std::function<bool(const Part&)>& see);

    /** @return the first valid tag of the file's streams at or after `from`, after any amount of damage */
    std::optional<Tag> Find(int64_t from, int64_t to);

private:
    Part PartAt(int64_t position, int64_t to);
    std::optional<Tag> Search(int64_t from, int64_t to);
    bool IsLinked(const Tag& tag);
    bool CouldFollow(int64_t position);

    struct Closer {
        void operator()(fio_file_t* reader) const { __FLV_DMX__fioClose(reader); }
    };
    const std::string m_name;
    flvd_ctx_t* const m_instance;
    const Progress m_progress;
    const std::unique_ptr<fio_file_t, Closer> m_reader;
    int64_t m_size = 0;
    struct {
        int64_t from = -1;
        int64_t end = -1; // no valid tag starts before it
        std::optional<Tag> tag{};
    } m_found; // by the last search
};

} // namespace tool

#endif
