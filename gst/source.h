/*
 * The file that the element reads: the peer of its sink pad, wrapped for the callback host.
 */
#pragma once

#include "flvdmx/callback_host.h"

#include <gst/gst.h>

#include <cstddef>
#include <cstdint>
#include <memory>

namespace flvdmx_gst {

/** Used by one thread at a time, which may hold the lock for opens: that is released while the peer is busy. */
class Source {
public:
    /** Reads through a sink pad in pull mode. */
    explicit Source(GstPad* pad);
    ~Source() { flvd_callback_host_remove(&m_file); }
    Source(const Source&) = delete;
    Source& operator=(const Source&) = delete;

    /** The name under which the library opens it. */
    const char* name() const { return m_file.name; }

    /** Why the last read returned nothing: GST_FLOW_OK if it did return bytes, or at the end of the file. The library
     *  treats every empty read as the end of the file. */
    GstFlowReturn flow() const { return m_flow; }
    /** Clears a failure. Until then, all reads return nothing, so call it before the library reads again. */
    void clear_flow() { m_flow = GST_FLOW_OK; }
    /** Discards the window: the peer may have another file now. */
    void reset();

    /** In bytes; -1 if the peer does not know it. */
    int64_t size() const;
    /** Reads exactly `size` bytes; false if there are fewer. */
    bool read_all(int64_t position, uint8_t* destination, size_t size);

private:
    uint32_t read(int64_t position, uint8_t* destination, uint32_t size);
    uint32_t read_window(int64_t position, uint8_t* destination, uint32_t size);
    uint32_t pull(int64_t position, uint8_t* destination, uint32_t size);
    uint32_t pull_once(int64_t position, uint8_t* destination, uint32_t size);

    GstPad* const m_pad;
    flvd_callback_file_t m_file;
    GstFlowReturn m_flow = GST_FLOW_OK;
    int64_t m_size = 0;     // bytes, updated when a read starts at or after it
    int64_t m_read_end = 0; // end of the last read that bypassed the window
    std::unique_ptr<uint8_t[]> m_window;
    int64_t m_window_start = 0;
    uint32_t m_window_size = 0;
};

} // namespace flvdmx_gst
