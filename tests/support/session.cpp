#include "session.h"

#include <sstream>
#include <tuple>

namespace flvd_test {

static constexpr uint32_t POISON = 0x5A5A5A5A;

// Of one operation and result: codes, each with its lines and the initials of the host functions that lead there.
struct Lines {
    Op op;
    int32_t rc;
    const char* text;
};
static constexpr Lines LINES[] = {
    {Op::Open, -1, "-4 2335a -7 2413a -1004 2423st -1002 2434s 2458s -1005 2465st -2 2496s"},
    {Op::Open, -4, "-5 2386oa -6 2396oa"},
    {Op::Open, -2, "-10002 2440s"},
    {Op::Inside, 0,
     "-1 226t 347t 364t 375t 479t -2 241s 308s 338s 357s 405s 449s 503s -10001 248t 486s 510t"}, // extent
    {Op::Inside, 0, "-10002 659r 694r 741 781 818r 841 863 881 913 -3 752a 924a -3001 932"},     // codecs
    {Op::Inside, 0, "-3002 847 869 887 938 -3003 700 787 -3004 946"},
    {Op::Inside, 0, "0 2536a 2550a 2602a -10002 2521r 2540r 2554r 2579r 2606r"}, // frames; 0: passed over
    {Op::Frame, -1, "-4007 2638 2767 -4002 2651 2783 -4003 2661 2796 -4004 2667 2802"},
    {Op::Frame, -1, "-1 2840t -2 2830s 2859s 2881s 2899s 2921s 2933s 2945t"},
    {Op::Frame, -2, "-10002 2737 2957"},
    {Op::Seek, -1, "-4007 2982 3190 -10003 2987 3195 -1 3065t 3088t 3111t 3269t 3288t 3295t"},
    {Op::Seek, -1, "-2 3045s 3252s 3299s -2000 3072s 3095t 3118s 3276s"},
    {Op::Seek, -2, "-2003 3161 3338"},
    {Op::FrameSeek, -1, "-1 134t -2 140s 263s 290s 316s 335s 404s 432s 747s -2006 171t 231t 355 452 778t 817t"},
    {Op::FrameSeek, -1, "-2007 325 -10002 342 439 -10003 844"}};

const std::vector<Place>& Places()
{
    static const std::vector<Place> places = [] {
        std::vector<Place> all;
        for (const Lines& lines : LINES) {
            std::istringstream in(lines.text);
            int32_t code = 0;
            for (std::string word; in >> word;)
                if (const int32_t number = std::stoi(word); number <= 0)
                    code = number;
                else
                    all.push_back({lines.op, lines.rc, code, number, word.substr(std::to_string(number).size())});
        }
        return all;
    }();
    return places;
}

bool IsListed(Op op, int32_t rc, int32_t code, int32_t line)
{
    for (const Place& place : Places())
        if (std::tie(place.op, place.rc, place.code, place.line) == std::tie(op, rc, code, line))
            return true;
    return false;
}

Session::Session(FakeHost& host, const OpenOptions& options)
{
    const flvd_init_t init = host.init(options.options, options.cache_size, options.scan_read_size, options.path);
    if ((options.options & FLVD_OPT_USER_BUFFER) != 0)
        m_user_buffer.resize(options.user_buffer_size);
    m_open_rc = QVX_FLV_DMX(options.for_info ? FLVD_OP_OPEN_INFO : FLVD_OP_OPEN, &m_ctx, &init, &m_info);
}

Session::~Session()
{
    if (m_ctx != nullptr)
        close();
}

FrameResult Session::frame(uint32_t stream)
{
    uint8_t* const buffer = m_user_buffer.empty() ? nullptr : m_user_buffer.data();
    const flvd_frame_request_t request{buffer, static_cast<uint32_t>(m_user_buffer.size()), stream};
    flvd_frame_t out{nullptr, POISON, POISON, POISON, {POISON, POISON}};
    FrameResult result = {QVX_FLV_DMX(FLVD_OP_GET_FRAME, &m_ctx, &request, &out), {}};
    const bool delivered = result.rc == 0 && out.data != nullptr;
    result.frame = {out.stream, out.timestamp_ms, delivered ? Bytes(out.data, out.data + out.size) : Bytes{}};
    return result;
}

int32_t Session::seek(int32_t time, uint32_t mode, int32_t* reached)
{
    const flvd_seek_request_t request{time, mode};
    int32_t ignored = 0;
    return QVX_FLV_DMX(FLVD_OP_SEEK, &m_ctx, &request, reached != nullptr ? reached : &ignored);
}

int32_t Session::close()
{
    const int32_t rc = QVX_FLV_DMX(FLVD_OP_CLOSE, &m_ctx, nullptr, nullptr);
    m_ctx = nullptr;
    return rc;
}

Frames play(Session& session, uint32_t stream, int32_t* rc)
{
    Frames frames;
    FrameResult result = session.frame(stream);
    for (; result.rc == 0; result = session.frame(stream))
        frames.push_back(std::move(result.frame));
    if (rc != nullptr)
        *rc = result.rc;
    return frames;
}

} // namespace flvd_test
