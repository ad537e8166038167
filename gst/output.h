/*
 * The output of one stream: a source pad of the element, and what is pushed from it.
 */
#pragma once

#include "flvdmx/flvdmx.hpp"

#include <gst/gst.h>

#include <memory>

namespace flvdmx_gst {

struct CapsDeleter {
    void operator()(GstCaps* caps) const { gst_caps_unref(caps); }
};
/** Caps that are released at the end. */
using OwnedCaps = std::unique_ptr<GstCaps, CapsDeleter>;

/** The time for a buffer; GST_CLOCK_TIME_NONE if it is negative. */
inline GstClockTime to_clock_time(flvdmx::Milliseconds time)
{
    return time.count() >= 0 ? static_cast<GstClockTime>(time.count()) * GST_MSECOND : GST_CLOCK_TIME_NONE;
}

/** Used under the stream lock. */
class Output {
public:
    /** An output without a pad. */
    Output() = default;
    /** Makes an active pad from the element's template of that name. The element owns it after it has been added. */
    Output(GstElement* element, const char* name, OwnedCaps caps);

    GstPad* pad() const { return m_pad; }          /**< null for an output without a pad */
    GstCaps* caps() const { return m_caps.get(); } /**< the current ones */

    /** Pushes the events that come before all others. */
    void start(GstElement* element, guint group, guint32 sequence);
    /** Announces the caps if they differ from the current ones. */
    void change_caps(OwnedCaps caps, guint32 sequence);
    /** Pushes a frame that is to be decoded at `time`. Takes ownership of the buffer, which holds the frame's bytes. */
    GstFlowReturn push(GstBuffer* buffer, const flvdmx::Frame& frame, flvdmx::Milliseconds time);

    /** Call it after a seek: the next buffer is discontinuous and begins at about `time`, the segment at `start`. An
     *  accurate seek reads from a keyframe before its segment. */
    void jump(GstClockTime time, GstClockTime start);
    /** Marks the next buffer as discontinuous, after damage. */
    void mark_damage() { m_discontinuity = true; }
    /** Call it when the file has reached `time`: announces a gap if the stream lags too far behind. */
    void reach(GstClockTime time, guint32 sequence);

    /** Pushes an event with the sequence number of the open or seek that it belongs to. Takes ownership. */
    void push_event(GstEvent* event, guint32 sequence);

private:
    GstPad* m_pad = nullptr;
    OwnedCaps m_caps;
    GstClockTime m_reached = 0; // by the last buffer or gap
    GstClockTime m_start = 0;   // of the segment; sinks ignore gaps before it
    bool m_discontinuity = true;
    bool m_waits = true; // the sink has received nothing since the start or a jump
};

} // namespace flvdmx_gst
