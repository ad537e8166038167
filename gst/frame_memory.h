/*
 * The buffer into which the library writes a frame.
 */
#pragma once

#include "flvdmx/result.hpp"

#include <gst/gst.h>

#include <utility>

namespace flvdmx_gst {

class FrameMemory {
public:
    FrameMemory() = default;
    FrameMemory(const FrameMemory&) = delete;
    FrameMemory& operator=(const FrameMemory&) = delete;
    ~FrameMemory()
    {
        unmap();
        gst_clear_buffer(&m_buffer);
    }

    /** Makes a buffer and maps it. Returns null if there is no memory. */
    uint8_t* allocate(size_t size)
    {
        m_buffer = gst_buffer_new_allocate(nullptr, size, nullptr);
        if (m_buffer != nullptr)
            gst_buffer_map(m_buffer, &m_map, GST_MAP_WRITE);
        return m_map.data;
    }

    /** Returns a buffer with the frame, owned by the caller: usually the one that the library wrote to. */
    GstBuffer* take(const flvdmx::Bytes& frame)
    {
        const bool is_there = frame.data() == m_map.data;
        unmap();
        if (is_there)
            return std::exchange(m_buffer, nullptr);
        GstBuffer* const buffer = gst_buffer_new_allocate(nullptr, frame.size(), nullptr);
        gst_buffer_fill(buffer, 0, frame.data(), frame.size());
        return buffer;
    }

private:
    void unmap()
    {
        if (m_map.data != nullptr)
            gst_buffer_unmap(m_buffer, &m_map);
        m_map = {};
    }

    GstBuffer* m_buffer = nullptr;
    GstMapInfo m_map{};
};

} // namespace flvdmx_gst
