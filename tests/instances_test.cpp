// Several instances at the same time and one after the other, calls in the wrong order, and wrong arguments.

#include "support/report.h"
#include "support/session.h"

#include <list>

using namespace flvd_test;

namespace {

// The outcome of the nth call in a sequence of frame requests and seeks.
std::string Step(Session& session, uint32_t n)
{
    int32_t reached = -1;
    const auto time = static_cast<int32_t>(n * 61 % 900);
    const FrameResult result = n % 7 == 6 ? FrameResult{session.seek(time, n % 2 == 0 ? BACK : FORTH, &reached), {}}
                                          : session.frame(1 + n % 2);
    return testing::PrintToString(
        std::tuple(result.rc, reached, result.frame, result.frame.data, session.last_error(), session.error_line()));
}

TEST(Instances, DoNotAffectEachOther)
{
    constexpr uint32_t STEPS = 100;
    FakeHost host(MakeChain().bytes);
    host.add_file("b.flv", MakeChain({true, true, true, true, 20, 3}).bytes);
    host.add_file("c.flv", File({Pcm(0), Screen(5, 5000), Pcm(20), Screen(30, 300), Pcm(40), Screen(50)}).bytes);
    std::vector<OpenOptions> all;
    for (const char* const path : {"a.flv", "b.flv", "c.flv"})
        for (const uint32_t options : {0u, SEPARATE | INDEX, GROWING, USER})
            all.push_back({options, false, 1024, 0, path});
    std::array<std::vector<std::string>, STEPS> alone;
    std::list<Session> together;
    for (const OpenOptions& open : all) {
        Session session(host, open);
        for (uint32_t n = 0; n < STEPS; ++n)
            alone.at(n).push_back(Step(session, n));
    }
    for (const OpenOptions& open : all)
        together.emplace_back(host, open);
    for (uint32_t n = 0; n < STEPS; ++n) {
        size_t i = 0;
        for (Session& session : together)
            EXPECT_EQ(Step(session, n), alone.at(n)[i++]) << n;
        if (n % 10 == 9)
            together.pop_back(); // the others continue
    }
}

TEST(Instances, RejectWrongCalls)
{
    FakeHost host(MakeChain().bytes);
    Session session(host);
    flvd_ctx_t *none = nullptr, *live = session.ctx();
    flvd_ctx_t** const no_handle = nullptr;
    const flvd_init_t init = host.init();
    flvd_open_info_t info{};
    const flvd_frame_request_t request{};
    flvd_frame_t frame{};
    const auto expect = [&](uint32_t operation, flvd_ctx_t** handle, const void* arg1, void* arg2, int32_t rc) {
        std::tie(g_flvd_lLastError, g_flvd_lErrorLine) = std::pair(77, 78);
        EXPECT_EQ(QVX_FLV_DMX(operation, handle, arg1, arg2), rc) << operation;
        EXPECT_EQ(std::pair(g_flvd_lLastError, g_flvd_lErrorLine),
                  rc == -3 ? std::pair(-4001, 2273) : std::pair(77, 78));
        for (flvd_ctx_t** const without : {&none, no_handle})
            EXPECT_EQ(QVX_FLV_DMX(FLVD_OP_GET_LAST_ERROR, without, nullptr, nullptr), g_flvd_lLastError);
        EXPECT_EQ(live, session.ctx());
        EXPECT_EQ(session.last_error(), 0);
    };
    for (flvd_ctx_t** const without : {&none, no_handle}) {
        for (const uint32_t operation : {FLVD_OP_CLOSE, FLVD_OP_GET_FRAME, FLVD_OP_SEEK})
            expect(operation, without, &request, &frame, -3);
        expect(FLVD_OP_RESERVED, without, nullptr, nullptr, -1);
    }
    for (const uint32_t operation : {FLVD_OP_OPEN, FLVD_OP_OPEN_INFO})
        expect(operation, no_handle, &init, &info, -1);
    for (const uint32_t operation : {FLVD_OP_OPEN, FLVD_OP_OPEN_INFO, FLVD_OP_GET_FRAME, FLVD_OP_SEEK})
        for (const bool first : {true, false}) {
            flvd_ctx_t* word = live;
            expect(operation, &word, first ? nullptr : &init, first ? &info : nullptr, -1);
            const bool opens = operation == FLVD_OP_OPEN || operation == FLVD_OP_OPEN_INFO;
            EXPECT_EQ(word, opens ? nullptr : live) << operation; // a rejected open is a failed open
        }
    for (const uint32_t operation : {6u, 7u, 8u, 9u, 11u, 0xFFFFFFFFu})
        expect(operation, &live, &init, &info, -1);
    EXPECT_EQ(QVX_FLV_DMX(FLVD_OP_RESERVED, &live, nullptr, nullptr), -1);
    EXPECT_TRUE(session.recorded(Site::RESERVED_OPERATION)); // changes

    Session user(host, {USER});
    const flvd_frame_request_t no_buffer{nullptr, 100000, 0};
    flvd_ctx_t* ctx = user.ctx();
    EXPECT_EQ(QVX_FLV_DMX(FLVD_OP_GET_FRAME, &ctx, &no_buffer, &frame), -2); // no frame fits

    FakeHost empty(Bytes{});
    const flvd_init_t empty_init = empty.init();
    EXPECT_EQ(QVX_FLV_DMX(FLVD_OP_OPEN, &live, &empty_init, &info), -1);
    EXPECT_EQ(live, nullptr); // also replaces the handle of an open instance
}

} // namespace
