// Script data: the input's payload is parsed as script data in the middle of a file. It is parsed twice, with different
// cache sizes, because the size of the cache must not matter.

#include "harness.h"

namespace flvd_fuzz {
namespace {

constexpr size_t START = 24; // file position of the payload

// What parsing a payload sets in an instance in the state of a probe that reaches the script tag.
Bytes outcome(Host& host, uint32_t options, uint32_t cache_size, uint32_t length)
{
    const flvd_init_t init = host.init(options, 0, 0);
    flvd_ctx_t ctx{};
    ctx.options = options;
    ctx.file_size = host.visible();
    ctx.cur_reader = host.open_reader({cache_size});
    FLVD_SetCallbackforMeta(&init);
    __FLV_DMX__fioSeek64(ctx.cur_reader, START, FIO_SEEK_SET);
    host.begin(2000 + 30 * host.contents().size());
    const int32_t rc = FLVD_ReadMetadata(&ctx, length);
    require(rc == 0 || rc == -1, "a result that parsing metadata cannot have");
    require(host.position(ctx.cur_reader) == int64_t{START} + length, "the reader is not after the payload");

    const auto& [index, arrays] = std::tie(ctx.keyframe_index, ctx.keyframe_arrays);
    const auto end = host.visible() + 5; // a key in the last bytes announces an array after the file
    require(index.times_offset <= end && index.positions_offset <= end, "an index outside the file");
    require(arrays.times_count <= length && arrays.positions_count <= length, "an array larger than the payload");
    const bool kept = (options & (FLVD_OPT_PROGRESSIVE | FLVD_OPT_INDEX_IN_MEMORY)) != 0;
    require(kept || arrays.times_ms == nullptr, "an index in memory that was not requested");
    const Bytes values = Concat({bytes_of(rc), copy_of(arrays.times_ms, arrays.times_count * sizeof *arrays.times_ms),
                                 copy_of(arrays.positions, arrays.positions_count * sizeof *arrays.positions)});
    init.mem_free(arrays.times_ms);
    init.mem_free(arrays.positions);
    __FLV_DMX__fioClose(ctx.cur_reader);
    ctx.cur_reader = nullptr;
    ctx.keyframe_arrays.times_ms = nullptr;
    ctx.keyframe_arrays.positions = nullptr;
    return Concat({values, bytes_of(ctx)});
}

void run(Input& input)
{
    Bytes file = Concat({Bytes(START, 0x11), input.payload()});
    const uint32_t options = input.byte() & 0x0Fu;
    const uint32_t more = input.byte(); // bytes by which the script data is shorter or longer than the payload
    const uint32_t cache_size = 256u + 16u * input.byte();
    const auto size = static_cast<uint32_t>(input.payload().size());
    const uint32_t length = more < size ? size - more : size + more + 1;
    Host host(std::move(file));
    require(outcome(host, options, 4096, length) == outcome(host, options, cache_size, length),
            "values that depend on the cache");
}

const Target g_target("script", run);

} // namespace
} // namespace flvd_fuzz
