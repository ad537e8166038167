/*
 * One stream on its way downstream: a source pad of the element and what flows over it.
 */
#pragma once

#include "flvdmx/flvdmx.hpp"

#include <gst/gst.h>

#include <memory>

namespace flvdmx_gst {

struct CapsDeleter {
    void operator()(GstCaps* caps) const { gst_caps_unref(caps); }
};
/** Caps that somebody owns. */
using OwnedCaps = std::unique_ptr<GstCaps, CapsDeleter>;

/** As buffers have it; none when it is negative. */
inline GstClockTime to_clock_time(flvdmx::Milliseconds time)
{
    return time.count() >= 0 ? static_cast<GstClockTime>(time.count()) * GST_MSECOND : GST_CLOCK_TIME_NONE;
}

/** Used under the stream lock. */
class Output {
public:
    /** Nothing flows. */
    Output() = default;
    /** Makes an active pad from the element's template of that name; it is the element's once it was added. */
    Output(GstElement* element, const char* name, OwnedCaps caps);

    GstPad* pad() const { return m_pad; }          /**< null when nothing flows */
    GstCaps* caps() const { return m_caps.get(); } /**< in force */

    /** The events that come before all others. */
    void start(GstElement* element, guint group);
    /** Announces other caps, unless they are the same. */
    void change_caps(OwnedCaps caps);
    /** Pushes a frame that is to be decoded at `time` and whose bytes are in the buffer, which it takes. */
    GstFlowReturn push(GstBuffer* buffer, const flvdmx::Frame& frame, flvdmx::Milliseconds time);

    /** What comes next does not follow what came before, and begins at about `time`. */
    void jump(GstClockTime time);
    /** The next buffer comes after damage. */
    void mark_damage() { m_discontinuity = true; }
    /** The file has reached `time`: tells a sink that waits for a stream without frames. */
    void reach(GstClockTime time);

private:
    GstPad* m_pad = nullptr;
    OwnedCaps m_caps;
    GstClockTime m_reached = 0; // by the last buffer or gap
    bool m_discontinuity = true;
    bool m_waits = true; // a sink that has received nothing since the start or a jump
};

} // namespace flvdmx_gst
