// Whole sessions: the control bytes are commands to the library and to its host, the payload is the file.
//
// Each result is checked: its code, the record, the bytes of a frame, the positions of the readers, and the number of
// host calls. While calls fail, positions are not checked. After the host has broken its contract, only codes, memory
// and the number of calls are checked until the file is closed.

#include "support/session.h"
#include "harness.h"

using namespace flvd_fuzz;

namespace {

constexpr uint32_t MAX_COMMANDS = 64, MAX_PLAYED = 24; // MAX_PLAYED: frames requested after the commands
constexpr uint64_t PATIENCE = 2000;      // usual bound for a host that breaks its contract, which can be very slow
constexpr uint64_t BUDGETS = 30'000'000; // host calls allowed without that bound
constexpr int32_t UNTOUCHED = 0x5A;
constexpr std::array<uint32_t, 8> CACHES = {0, 1024, 1, 1500, 65536, 4096, 16000, 0xFFFFFFFF};

class Run {
public:
    explicit Run(const Bytes& file) : m_host(file) {}
    bool was_opened() const { return m_was_opened; }

    void command(Input& input)
    {
        const uint8_t code = input.byte();
        const uint32_t argument = code >> 4u;
        const auto fn = static_cast<HostFn>(argument % static_cast<uint32_t>(HostFn::Eof));
        m_faulty = (code % 16 >= 4 && code % 16 <= 7) || m_faulty;
        switch (code % 16) {
        case 0:
            return open(input);
        case 1:
            return close();
        case 2:
            return seek((input.word() - 2000) * (argument > 13 ? 32768 : 1), input.byte());
        case 3: // an open file only grows
            return m_host.set_visible(input.word() + (m_ctx != nullptr ? 1 + m_host.visible() : 0));
        case 4:
            return m_host.fail_nth_call(m_host.failable_calls() + 1 + input.byte());
        case 5:
            return m_host.fail_nth(fn, m_host.calls(fn) + 1 + input.byte());
        case 6:
            return m_host.fail_from(fn, m_host.calls(fn) + 1 + input.byte());
        case 7:
            return m_host.limit_reads(input.byte());
        case 8:
            m_breaches ^= 1u << argument % static_cast<uint32_t>(Breach::Count);
            m_broken = m_broken || m_breaches != 0;
            return m_host.break_contract(m_breaches, input.byte() == 0xFF || m_breaches == 0 ? UINT64_MAX : PATIENCE);
        case 10:
            m_faulty = false;
            return m_host.fail_nothing();
        default:
            for (uint32_t i = 0; i <= argument / 4; ++i)
                frame(argument % 4);
        }
    }

    void open(Input& input)
    {
        close();
        m_was_opened = true;
        const uint8_t bits = input.byte(), sizes = input.byte();
        if ((bits & 0x80u) != 0)
            m_host.use_32_bit_only();
        const uint32_t room = (bits & USER) != 0 ? input.word() : 0;
        m_broken = m_breaches != 0;
        begin();
        m_session.emplace(m_host, OpenOptions{bits & 0x0Fu, (bits & 0x70u) == 0x70u, CACHES[sizes % CACHES.size()],
                                              sizes / 8u, FakeHost::DEFAULT_FILE, room});
        m_ctx = m_session->ctx();
        require(m_session->opened() == (m_ctx != nullptr), "result and instance of an open disagree");
        if (m_ctx != nullptr)
            return check_opened(m_session->info());
        require(m_session->failed_as_listed(Op::Open, m_session->open_rc()), "a failure that opens cannot have");
        m_host.require_clean();
    }

    void close()
    {
        begin();
        require(m_ctx == nullptr || m_session->close() == 0, "a close failed");
        m_ctx = nullptr;
        m_host.require_clean();
    }

    void frame(uint32_t stream)
    {
        if (m_ctx == nullptr)
            return;
        const bool separate = has(SEPARATE) && m_ctx->opened_for_info == 0;
        const fio_file_t* const reader = separate && stream == AUDIO ? m_ctx->audio_reader : m_ctx->main_reader;
        begin();
        const int64_t before = current_position(reader);
        const int32_t rc = m_session->frame(stream).rc;
        const flvd_frame_t& frame = m_session->record();
        require(m_broken || m_faulty || current_position(reader) >= before, "a frame request moved back");
        if (rc == 0) {
            require(!separate || frame.stream == stream, "a frame of the wrong stream");
            return check_frame(frame, m_host.position(reader) - 4);
        }
        require(m_session->failed_as_listed(Op::Frame, rc), "a failure that frame requests cannot have");
        const bool refused = m_ctx->error <= FLVD_ERR_NO_VIDEO && m_ctx->error >= FLVD_ERR_INFO_ONLY;
        require(bytes_of(frame) == Bytes(sizeof frame, refused ? Session::POISON : 0),
                "wrong record after a failed request");
    }

private:
    bool has(uint32_t option) const { return (m_ctx->options & option) != 0; }
    void begin() { m_host.begin(m_broken ? BUDGETS : 4000 + 40 * static_cast<uint64_t>(m_host.visible())); }
    void check_opened(const flvd_open_info_t& info) const
    {
        const bool video = (m_ctx->streams & FLVD_STREAM_VIDEO) != 0, audio = (m_ctx->streams & FLVD_STREAM_AUDIO) != 0;
        const auto& arrays = m_ctx->keyframe_arrays;
        require(video || audio, "an open without a stream succeeded");
        require(info.has_video == (video ? 1u : 0u) && info.has_audio == (audio ? 1u : 0u), "wrong streams");
        require(info.file_info == &m_ctx->file_info, "wrong record of the file");
        require(info.video_info == (video ? &m_ctx->video_info : nullptr), "wrong record of the video");
        require(info.audio_info == (audio ? &m_ctx->audio_info : nullptr), "wrong record of the audio");
        require(info.video_config == info.video_info && info.audio_config == info.audio_info, "records that differ");
        copy_of(m_ctx->video_info.config, m_ctx->video_info.config_size);
        copy_of(m_ctx->audio_info.config, m_ctx->audio_info.config_size);
        copy_of(arrays.times_ms, arrays.times_count * sizeof *arrays.times_ms);
        copy_of(arrays.positions, arrays.positions_count * sizeof *arrays.positions);
        require(m_broken || m_faulty || has(FLVD_OPT_PROGRESSIVE) || m_ctx->data_end <= m_host.visible(),
                "the data ends past the file");
    }

    // Where delivery continues: in a growing file, the saved position of a tag that is to be retried takes precedence.
    int64_t current_position(const fio_file_t* reader)
    {
        const int64_t saved = reader == m_ctx->main_reader ? m_ctx->saved_main_pos : m_ctx->saved_audio_pos;
        return has(FLVD_OPT_PROGRESSIVE) && saved != 0 ? saved : m_host.position(reader);
    }

    // While calls fail, skipping the back-pointer may have failed too; the tag may then be anywhere.
    void check_frame(const flvd_frame_t& frame, int64_t end) const
    {
        const Bytes& buffer = m_session->user_buffer();
        require(buffer.empty() || (frame.data == buffer.data() && frame.size <= buffer.size()),
                "a frame outside the caller's buffer");
        copy_of(frame.data, frame.size);
        end = m_faulty ? m_host.visible() : end;
        while (m_faulty && end > 0 && !is_tag_of(frame, end))
            --end;
        require(m_broken || is_tag_of(frame, end), "a frame that is not a tag of the file");
    }

    // Whether the file holds this frame, as the data of a tag of its kind, size and time that ends there.
    bool is_tag_of(const flvd_frame_t& frame, int64_t end) const
    {
        const int64_t start = end - frame.size;
        if (start < 0 || end > m_host.visible() ||
            !std::equal(frame.data, frame.data + frame.size, m_host.contents().data() + start))
            return false;
        const uint32_t type = frame.stream == VIDEO ? 9 : 8, timestamp = frame.timestamp_ms + m_ctx->first_ts;
        for (const uint32_t header : {1u, 2u, 5u}) // of the codec
            if (FileTag tag; read_tag(m_host.contents(), start - header - 11, &tag) && tag.type == type &&
                             tag.size == frame.size + header && tag.timestamp == timestamp)
                return true;
        return false;
    }

    void seek(int32_t time, uint32_t bits)
    {
        if (m_ctx == nullptr)
            return;
        const uint32_t mode = (bits & 0x10u) | (bits & 3u) << 8 | (bits & 0x0Cu) << 14;
        int32_t reached = UNTOUCHED;
        begin();
        const int64_t main = current_position(m_ctx->main_reader), audio = current_position(m_ctx->audio_reader);
        const int32_t rc = m_session->seek(time, mode, &reached);
        const bool checked = !m_broken && !m_faulty;
        if (rc == 0 && checked && ((mode & FLVD_SEEK_RELATIVE) == 0 || time != 0))
            return check_landing(reached);
        require(rc == 0 || m_session->failed_as_listed(Op::Seek, rc), "a failure that seeks cannot have");
        require(rc == 0 || reached == UNTOUCHED, "a failed seek wrote a time");
        const bool stays = rc != 0 && checked && (mode & FLVD_SEEK_TO_END_ON_MISS) == 0;
        require(!stays ||
                    (current_position(m_ctx->main_reader) == main && current_position(m_ctx->audio_reader) == audio),
                "a failed seek lost the position");
    }

    void check_landing(int32_t reached)
    {
        const int64_t position = m_host.position(m_ctx->main_reader);
        require(position >= m_ctx->data_offset && position <= m_host.visible(), "a seek left the data");
        FileTag tag;
        if ((m_ctx->streams & FLVD_STREAM_VIDEO) == 0 || position == m_ctx->data_offset)
            return;
        require(read_tag(m_host.contents(), position, &tag), "a seek landed where there is no tag");
        require(tag.timestamp == m_ctx->first_ts + static_cast<uint32_t>(reached), "a seek reported the wrong time");
        if (m_ctx->seek_method == FLVD_SEEK_BY_SCAN) // an index may point at any tag with about the same time
            require(tag.video() && tag.keyframe(), "a seek by scanning did not land on a keyframe");
    }

    Host m_host;
    std::optional<Session> m_session;
    flvd_ctx_t* m_ctx = nullptr; // null when none is open
    uint32_t m_breaches = 0;
    bool m_was_opened = false, m_broken = false; // m_broken is kept until the file is closed
    bool m_faulty = false;                       // calls may fail or read short
};

void run(Input& input)
{
    Run session(input.payload());
    for (uint32_t i = 0; i < MAX_COMMANDS && !input.empty(); ++i)
        session.command(input);
    if (!session.was_opened())
        session.open(input);
    for (uint32_t i = 0; i < MAX_PLAYED; ++i)
        session.frame(1 + i % 2);
    session.close();
}

const Target g_target("session", run);

} // namespace
