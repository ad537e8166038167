#include "harness.h"

#include <cstdio>
#include <cstdlib>

namespace flvd_fuzz {

void require(bool holds, const char* what)
{
    if (holds)
        return;
    std::fprintf(stderr, "check failed: %s\n", what);
    std::abort();
}

Bytes copy_of(const void* begin, size_t size)
{
    const auto* const first = static_cast<const uint8_t*>(begin);
    return Bytes(first, first + size);
}

Input::Input(const uint8_t* data, size_t size)
{
    if (size == 0)
        return;
    const uint8_t* const end = data + size - 1;
    const uint8_t* const control = end - std::min<std::ptrdiff_t>(*end, end - data);
    m_payload.assign(data, control);
    m_control.assign(control, end);
}

Host::Host(Bytes file) : FakeHost(std::move(file))
{
    on_call = [this](HostFn) { require(m_calls_left-- != 0, "the operation made too many host calls"); };
}

// Work costs patience only while the host breaks its contract.
bool Host::refuses(uint64_t effort)
{
    const bool refused = m_patience == 0;
    if (m_breaches != 0)
        m_patience -= std::min(effort, m_patience);
    return refused;
}

int32_t Host::eof(void* handle)
{
    const int32_t at_end = FakeHost::eof(handle);
    return breaks(Breach::AlwaysAtEnd) ? 1 : breaks(Breach::NeverAtEnd) ? 0 : at_end;
}

uint32_t Host::read(void* buffer, uint32_t size, uint32_t count, void* handle)
{
    if (refuses(1))
        return 0;
    const uint32_t got = FakeHost::read(buffer, size, count, handle);
    refuses(got / 1024);
    if (breaks(Breach::ReadStays))
        FakeHost::seek(handle, -int64_t{got}, FIO_SEEK_CUR, true);
    return breaks(Breach::ReadClaimsMore) ? count + 1 : got;
}

int32_t Host::seek(void* handle, int64_t offset, int32_t whence, bool wide)
{
    if (refuses(1) || breaks(Breach::SeekStays))
        return breaks(Breach::SeekStays) ? 0 : -1;
    return FakeHost::seek(handle, offset, breaks(Breach::SeekIgnoresWhence) ? FIO_SEEK_SET : whence, wide);
}

int64_t Host::tell(void* handle, bool wide)
{
    const int64_t position = refuses(1) ? -1 : FakeHost::tell(handle, wide);
    const auto call = static_cast<int64_t>(calls(HostFn::Tell));
    if (breaks(Breach::TellGoesBack) && position > call % 16)
        return position - call % 2 * (call % 16);
    if (position >= 0 && breaks(Breach::TellHuge))
        return INT64_MAX - call;
    return position >= 0 && breaks(Breach::TellStays) ? 20 : position;
}

int64_t Host::position(const fio_file_t* reader)
{
    const int64_t host = FakeHost::tell(reader->handle, true);
    return reader->state == FIO_STATE_READ ? host - reader->count : host + reader->count;
}

uint32_t read_be(const uint8_t* bytes, size_t count)
{
    uint32_t value = 0;
    for (size_t i = 0; i < count; ++i)
        value = value << 8 | bytes[i];
    return value;
}

bool read_tag(const Bytes& file, int64_t position, FileTag* tag)
{
    if (position < 0 || position + 13 > static_cast<int64_t>(file.size()))
        return false;
    const uint8_t* const at = file.data() + position;
    const uint32_t timestamp = read_be(at + 4, 3) | uint32_t{at[7]} << 24;
    *tag = {at[0], read_be(at + 1, 3), timestamp, read_be(at + 8, 3), at[11], at[12]};
    return true;
}

} // namespace flvd_fuzz
