// Playing reads the file in order and in large blocks, which are read directly into the library's memory. Opening and
// seeking make many small reads, often backward, which are served from a window.

#include "source.h"

#include "open_lock.h"

#include <algorithm>
#include <cstring>

namespace flvdmx_gst {

namespace {

constexpr uint32_t window_capacity = 65536; // a power of two
constexpr uint32_t large_read = 4096;

} // namespace

Source::Source(GstPad* pad) : m_pad(pad), m_file{}
{
    m_file.read_at = [](void* user, int64_t position, void* buffer, uint32_t size) {
        return static_cast<Source*>(user)->read(position, static_cast<uint8_t*>(buffer), size);
    };
    m_file.get_size = [](void* user) { return static_cast<const Source*>(user)->size(); };
    m_file.user = this;
    flvd_callback_host_add(&m_file);
}

void Source::reset()
{
    m_flow = GST_FLOW_OK;
    m_size = m_read_end = m_window_start = 0;
    m_window_size = 0;
}

bool Source::read_all(int64_t position, uint8_t* destination, size_t size)
{
    size_t got = 0;
    for (size_t more = 1; got < size && more != 0; got += more)
        more = read_window(position + static_cast<int64_t>(got), destination + got, static_cast<uint32_t>(size - got));
    return got == size;
}

uint32_t Source::read(int64_t position, uint8_t* destination, uint32_t size)
{
    if (m_flow != GST_FLOW_OK)
        return 0;
    const bool in_window = position >= m_window_start && position - m_window_start < m_window_size;
    if (in_window || (size < large_read && position != m_read_end))
        return read_window(position, destination, size);
    const uint32_t got = pull(position, destination, size);
    m_read_end = position + got;
    return got;
}

uint32_t Source::read_window(int64_t position, uint8_t* destination, uint32_t size)
{
    const int64_t start = position & -int64_t{window_capacity};
    if (m_window == nullptr)
        m_window = std::make_unique<uint8_t[]>(window_capacity);
    if (start != m_window_start || position - start >= m_window_size) {
        m_window_start = start;
        m_window_size = pull(start, m_window.get(), window_capacity);
    }
    const int64_t offset = position - start;
    if (offset >= m_window_size)
        return 0;
    const uint32_t got = std::min(size, m_window_size - static_cast<uint32_t>(offset));
    std::memcpy(destination, m_window.get() + offset, got);
    return got;
}

// A peer may return less than requested, although it should do so only at the end of the file.
uint32_t Source::pull(int64_t position, uint8_t* destination, uint32_t size)
{
    const OpenLock::Pause pause;
    uint32_t got = 0;
    for (uint32_t more = 1; got < size && more != 0; got += more)
        more = pull_once(position + got, destination + got, size - got);
    return got;
}

// The peer fills a buffer that wraps the destination. It would not report a short read at the end of the file, so
// the request is limited to the file's size.
uint32_t Source::pull_once(int64_t position, uint8_t* destination, uint32_t size)
{
    if (position >= m_size)
        m_size = this->size();
    const auto wanted = static_cast<uint32_t>(std::clamp<int64_t>(m_size - position, 0, size));
    if (wanted == 0)
        return 0;
    GstBuffer* buffer =
        gst_buffer_new_wrapped_full(GST_MEMORY_FLAG_NO_SHARE, destination, wanted, 0, wanted, nullptr, nullptr);
    const GstFlowReturn flow = gst_pad_pull_range(m_pad, static_cast<guint64>(position), wanted, &buffer);
    const auto filled = static_cast<uint32_t>(std::min<size_t>(gst_buffer_get_size(buffer), wanted));
    gst_buffer_unref(buffer);
    if (flow != GST_FLOW_OK && flow != GST_FLOW_EOS)
        m_flow = flow;
    return flow == GST_FLOW_OK ? filled : 0;
}

int64_t Source::size() const
{
    const OpenLock::Pause pause;
    gint64 size = -1;
    return gst_pad_peer_query_duration(m_pad, GST_FORMAT_BYTES, &size) != FALSE ? size : -1;
}

} // namespace flvdmx_gst
