// Checks the cached file and its bit reader against a plain array and a bit position: they must agree for any cache,
// read size and order of calls.

#include "harness.h"

using namespace flvd_fuzz;

namespace {

constexpr uint32_t BIT_READER_CACHE = 8; // a smaller cache does not hold what the bit reader peeks at

class Reader {
public:
    explicit Reader(Input& input) : m_host(input.payload()), m_data(m_host.contents())
    {
        const uint32_t extra = input.byte() % 32u;
        m_file = m_host.open_reader({1u + input.byte() % 64u, extra != 0 ? 1 : 0, extra});
        m_room = m_file->capacity + extra;
    }
    ~Reader() { __FLV_DMX__fioClose(m_file); }

    void call(uint8_t code, uint32_t n)
    {
        m_host.begin(1200); // with overread and a read size of 1, each byte costs a call
        apply(code, n);
        require(__FLV_DMX__fioTell64(m_file) == m_position, "wrong position");
        require(uint64_t{m_file->head} + m_file->count <= m_room, "more bytes cached than fit");
    }

private:
    int64_t left(int64_t n) const { return std::clamp<int64_t>(m_host.visible() - m_position, 0, n); }
    bool holds(const uint8_t* b, int64_t n) const { return n == 0 || std::equal(b, b + n, m_data.data() + m_position); }
    void move_to(int64_t position)
    {
        m_position = position;
        m_bits_valid = false;
    }

    void apply(uint8_t code, uint32_t n)
    {
        const uint8_t* bytes = nullptr;
        switch (code % 8) {
        case 0: {
            const uint32_t got = __FLV_DMX__fioShowBytesByPtr(&bytes, n, m_file);
            return require(got == std::min<int64_t>(left(n), m_room) && holds(bytes, got), "wrong bytes from a peek");
        }
        case 1: {
            const uint32_t element = 1 + code / 64u;
            const int64_t expected = left(int64_t{n} * element);
            Bytes copy(size_t{n} * element);
            const uint32_t got = __FLV_DMX__fioRead(copy.data(), element, n, m_file);
            require(got == expected / element && holds(copy.data(), expected), "wrong bytes from a read");
            return move_to(m_position + expected);
        }
        case 2:
            require(__FLV_DMX__fioSkipBytes(n, m_file) == n, "a skip failed");
            return move_to(m_position + n);
        case 3:
            return seek(code / 8 % 3, n);
        case 4:
            return require((__FLV_DMX__fioSetCacheReadSize(m_file, n % 80) == 1) == (n % 80 <= m_file->capacity),
                           "wrong result of setting the read size");
        case 5:
            __FLV_DMX__bitInit(m_file);
            m_bits_valid = m_room >= BIT_READER_CACHE;
            m_bit = m_position * 8;
            return;
        default:
            if (m_bits_valid)
                bits(code, n);
        }
    }
    void seek(int32_t whence, uint32_t n)
    {
        const int64_t offset = whence == FIO_SEEK_SET ? int64_t{n} * 3 : int64_t{n} - 128;
        const int64_t base = whence == FIO_SEEK_SET ? 0 : whence == FIO_SEEK_CUR ? m_position : m_host.visible();
        if (base + offset < 0)
            return;
        require(__FLV_DMX__fioSeek64(m_file, offset, whence) == 0, "a seek failed");
        move_to(base + offset);
    }
    uint32_t bit_field(uint32_t n) const
    {
        uint32_t value = 0;
        for (int64_t bit = m_bit; bit < m_bit + n; ++bit) {
            const uint32_t byte = bit / 8 < m_host.visible() ? m_data[static_cast<size_t>(bit / 8)] : 0u;
            value = value << 1u | (byte >> (7 - bit % 8) & 1u);
        }
        return value;
    }
    void bits(uint8_t code, uint32_t n)
    {
        const uint32_t length = code >= 192 ? n : n % 33;
        if (code >= 192)
            __FLV_DMX__bitSkipBitsLong(m_file, length);
        else if (code >= 128)
            __FLV_DMX__bitSkipBits(m_file, length);
        else if (code >= 64)
            return require(__FLV_DMX__bitShowUBits(m_file, length) == bit_field(length), "wrong bits from a peek");
        else
            require(__FLV_DMX__bitGetUBits(m_file, length) == bit_field(length), "wrong bits from a read");
        m_bit += length;
        m_position = (m_bit + 7) / 8;
    }

    Host m_host;
    const Bytes& m_data;
    fio_file_t* m_file = nullptr;
    uint32_t m_room = 0;
    bool m_bits_valid = false;
    int64_t m_position = 0, m_bit = 0;
};

const Target g_target("reader", run_calls<Reader, 120>);

} // namespace
