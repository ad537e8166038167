// Checks tag navigation against a second implementation over a plain array: every call must have the same result, tag
// and position. The host keeps its contract; the description of the file comes from the input. The second
// implementation has no cache and no budgets, because no input is long enough for 1 MiB without a tag or for 16,384
// failed checks.

#include "harness.h"

using namespace flvd_fuzz;

namespace {

constexpr uint32_t ANY_CODEC = 0xFFFF;
constexpr int64_t BEYOND = 64; // how far past the end of the file a reader may be moved
constexpr flvd_tag_info_t UNTOUCHED = {0x5A5A5A5A, 0x5A5A5A5A, 0x5A5A5A5A, 0x5A5A5A5A};
constexpr int32_t UNKNOWN = 1; // a seek before the start of the file was requested: the result is not defined

struct Found {
    int32_t rc = FLVD_ERR_END_OF_DATA;
    int64_t position = 0;
    FileTag tag{};
};

class Navigation {
public:
    explicit Navigation(Input& input) : m_host(input.payload()), m_file(m_host.contents())
    {
        const uint8_t bits = input.byte();
        m_ctx.data_offset = input.byte();
        m_ctx.data_end = (bits & 1u) != 0 ? std::min<int64_t>(input.word(), m_host.visible()) : m_host.visible();
        m_ctx.last_ts = (bits & 2u) != 0 ? input.word() : 0;
        m_ctx.video_codec_filter = (bits & 4u) != 0 ? input.byte() : ANY_CODEC;
        m_ctx.audio_format_filter = (bits & 8u) != 0 ? input.byte() : ANY_CODEC;
        m_ctx.cache_size = 1024u + (bits >> 4u) * 300u;
        m_reader = m_host.open_reader({m_ctx.cache_size});
    }
    ~Navigation() { __FLV_DMX__fioClose(m_reader); }

    void call(uint32_t code, uint32_t bits)
    {
        const int64_t from = m_host.position(m_reader);
        const uint32_t wanted = (bits & 3u) | (bits & 0x1Cu) << 14; // stream bits, then script, keyframe, configuration
        flvd_tag_info_t info = UNTOUCHED;
        m_host.begin(4000 + 40 * m_file.size());
        switch (code % 8) {
        case 0:
            __FLV_DMX__fioSeek64(m_reader, (code / 8 * 256 + bits) % (m_host.visible() + BEYOND), FIO_SEEK_SET);
            return;
        case 1:
            __FLV_DMX__fioSetCacheReadSize(m_reader, bits);
            return;
        case 2:
            return check_find(from, bits * 64);
        case 3:
            return check(FLVD_MoveToPrevTag(&m_ctx, m_reader, &info, wanted, nullptr), info, previous(from, wanted));
        case 4:
        case 5:
            return check(FLVD_MoveToNextTag(&m_ctx, m_reader, &info, wanted, nullptr), info, next(from, wanted));
        default:
            const int32_t verify = code % 8 == 6 ? 1 : 0;
            const int64_t begin = from == m_ctx.data_offset ? from + 4 : from;
            return check(FLVD_GetCurrTagInfo(&m_ctx, m_reader, &info, wanted, verify), info,
                         search(begin, wanted, verify != 0));
        }
    }

private:
    void check(int32_t rc, const flvd_tag_info_t& info, const Found& expected)
    {
        if (expected.rc == UNKNOWN)
            return;
        require(rc == expected.rc, "wrong result");
        const FileTag& tag = expected.tag;
        const flvd_tag_info_t described{tag.type, tag.size, tag.timestamp, tag.stream_id};
        require(bytes_of(info) == bytes_of(rc == 0 ? described : UNTOUCHED), "wrong record");
        require(rc != 0 || m_host.position(m_reader) == expected.position, "wrong position");
    }
    void check_find(int64_t from, uint32_t limit)
    {
        const int32_t rc = FLVD_FindNextTag(&m_ctx, m_reader, limit);
        const int64_t there = scan(from);
        const bool exists = there < m_host.visible();
        require(rc >= -1 && (rc >= 0 || !exists || there - from >= limit), "the search missed a tag");
        require(rc < 0 || (exists && from + rc == there && m_host.position(m_reader) == there),
                "the search ended at a wrong position");
    }

    // The position of the first plausible header at or after `position`, or the end.
    int64_t scan(int64_t position) const
    {
        FileTag tag;
        while (read_tag(m_file, position, &tag) && !(plausible(tag) && tag.timestamp < ceiling()))
            ++position;
        return read_tag(m_file, position, &tag) ? position : std::max(position, m_host.visible());
    }
    // The position after the tag if it counts as one, else of the next candidate.
    int64_t pass(int64_t position, const FileTag& tag, bool verify) const
    {
        return taken(position, tag, verify) ? position + 15 + tag.size : scan(position + 1);
    }
    Found search(int64_t position, uint32_t wanted, bool verify) const
    {
        FileTag tag;
        for (; read_tag(m_file, position, &tag); position = pass(position, tag, verify))
            if (taken(position, tag, verify) && is_wanted(tag, wanted))
                return {0, position, tag};
        return {};
    }
    Found next(int64_t position, uint32_t wanted) const
    {
        FileTag tag;
        if (position == m_ctx.data_offset)
            return search(position + 4, wanted, true);
        return read_tag(m_file, position, &tag) ? search(pass(position, tag, true), wanted, true) : Found{};
    }
    Found previous(int64_t position, uint32_t wanted) const
    {
        int64_t cursor = position > m_ctx.data_offset ? position - 4 : 0;
        while (cursor > m_ctx.data_offset) {
            FileTag tag;
            const int64_t start = cursor - back_pointer(cursor);
            const bool leads = start > 0 && start < cursor;
            if (leads && !read_tag(m_file, start, &tag))
                return {};
            const bool is_tag = leads && tag.size + 11 == back_pointer(cursor) && of_stream(tag);
            if (is_tag && is_wanted(tag, wanted))
                return {0, start, tag};
            if (is_tag && start < 4)
                return {UNKNOWN, 0, {}};
            cursor = is_tag ? start - 4 : cursor - 1;
        }
        return {FLVD_ERR_AT_FIRST_TAG, 0, {}};
    }

    // 0 if the file ends before it.
    uint32_t back_pointer(int64_t at) const { return at + 4 <= m_host.visible() ? read_be(m_file.data() + at, 4) : 0; }
    uint32_t ceiling() const { return m_ctx.last_ts != 0 ? m_ctx.last_ts : UINT32_MAX; }
    bool of_stream(const FileTag& tag) const
    {
        const bool codec = m_ctx.video_codec_filter == ANY_CODEC ||
                           (tag.first % 16 == m_ctx.video_codec_filter % 16 && tag.first < 0x60);
        const bool format = m_ctx.audio_format_filter == ANY_CODEC || tag.first == m_ctx.audio_format_filter;
        return tag.timestamp <= ceiling() && ((tag.video() && codec) || (tag.type == FLVD_TAG_TYPE_AUDIO && format) ||
                                              tag.type == FLVD_TAG_TYPE_SCRIPT);
    }
    bool plausible(const FileTag& tag) const { return of_stream(tag) && tag.size < m_ctx.data_end; }
    // Plausible; with `verify` the back-pointer must agree too, unless the tag is a script tag and the first tag.
    bool taken(int64_t position, const FileTag& tag, bool verify) const
    {
        const bool exempt = tag.type == FLVD_TAG_TYPE_SCRIPT && position <= m_ctx.data_offset + 4;
        return plausible(tag) && (!verify || exempt || back_pointer(position + 11 + tag.size) == tag.size + 11);
    }
    static bool is_wanted(const FileTag& tag, uint32_t wanted)
    {
        if (tag.type == FLVD_TAG_TYPE_SCRIPT)
            return (wanted & FLVD_TAG_SCRIPT) != 0;
        const bool packets = tag.video() ? tag.first % 16 == 7 : tag.first / 16 == 10;
        const bool config = (wanted & FLVD_TAG_CONFIG) == 0 || !packets || tag.second == 0;
        const bool kind = tag.video() && (wanted & FLVD_TAG_KEYFRAME) != 0 ? tag.keyframe() : config;
        return kind && (wanted & (tag.video() ? FLVD_TAG_VIDEO : FLVD_TAG_AUDIO)) != 0;
    }

    Host m_host;
    const Bytes& m_file;
    flvd_ctx_t m_ctx{};
    fio_file_t* m_reader = nullptr;
};

const Target g_target("navigation", run_calls<Navigation, 24>);

} // namespace
