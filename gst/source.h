/*
 * What the element reads: the peer of its sink pad, as a file of the callback host.
 */
#pragma once

#include "flvdmx/callback_host.h"

#include <gst/gst.h>

#include <cstddef>
#include <cstdint>
#include <memory>

namespace flvdmx_gst {

/** Used by one thread at a time, which may hold the lock for opens: it is released while the peer is busy. */
class Source {
public:
    /** Reads through a sink pad in pull mode. */
    explicit Source(GstPad* pad);
    ~Source() { flvd_callback_host_remove(&m_file); }
    Source(const Source&) = delete;
    Source& operator=(const Source&) = delete;

    /** The name by which the library opens it. */
    const char* name() const { return m_file.name; }

    /** Why the last read brought nothing: GST_FLOW_OK when it did, or when the file had ended. The library takes
     *  every such read for the end of the file. */
    GstFlowReturn flow() const { return m_flow; }
    /** Forgets a failure, after which nothing more is read. Call it before the library reads again. */
    void clear_flow() { m_flow = GST_FLOW_OK; }
    /** Forgets what was read: the peer may have another file now. */
    void reset();

    /** Bytes; -1 when the peer cannot tell. */
    int64_t size() const;
    /** Reads so many bytes; false when there are fewer. */
    bool read_all(int64_t position, uint8_t* destination, size_t size);

private:
    uint32_t read(int64_t position, uint8_t* destination, uint32_t size);
    uint32_t read_window(int64_t position, uint8_t* destination, uint32_t size);
    uint32_t pull(int64_t position, uint8_t* destination, uint32_t size);
    uint32_t pull_once(int64_t position, uint8_t* destination, uint32_t size);

    GstPad* const m_pad;
    flvd_callback_file_t m_file;
    GstFlowReturn m_flow = GST_FLOW_OK;
    int64_t m_size = 0;     // bytes, as of the last time that it mattered
    int64_t m_read_end = 0; // where the last read from outside the window ended
    std::unique_ptr<uint8_t[]> m_window;
    int64_t m_window_start = 0;
    uint32_t m_window_size = 0;
};

} // namespace flvdmx_gst
