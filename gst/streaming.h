/*
 * The work of the element: opens the file, pushes its frames and seeks. The task of the sink pad runs loop(). Seeks
 * arrive from any thread and take the stream lock of the sink pad, which the task holds while it runs.
 */
#pragma once

#include "output.h"
#include "skipped.h"
#include "source.h"
#include "timeline.h"

#include "flvdmx/flvdmx.hpp"

#include <gst/base/gstflowcombiner.h>
#include <gst/gst.h>

#include <array>
#include <atomic>
#include <memory>
#include <mutex>
#include <optional>

GST_DEBUG_CATEGORY_EXTERN(flvdmx_debug);

namespace flvdmx_gst {

/** Keeps the streaming thread of a pad from running; first waits for it to return from loop(). */
class StreamLock {
public:
    explicit StreamLock(GstPad* pad) : m_pad(pad) { GST_PAD_STREAM_LOCK(m_pad); }
    ~StreamLock() { GST_PAD_STREAM_UNLOCK(m_pad); }
    StreamLock(const StreamLock&) = delete;
    StreamLock& operator=(const StreamLock&) = delete;

private:
    GstPad* const m_pad;
};

class Streaming {
public:
    /** For an element, which must outlive it, and its sink pad. */
    Streaming(GstElement* element, GstPad* sink);
    ~Streaming();
    Streaming(const Streaming&) = delete;
    Streaming& operator=(const Streaming&) = delete;

    /** Starts or stops the task of the sink pad. */
    bool activate(bool active);
    /** Removes the pads and closes the file. The task must be stopped. */
    void close();

private:
    bool start_task();

    /* Called by the streaming thread. */
    void loop();
    void stop(GstFlowReturn flow);
    void finish();
    GstFlowReturn open();
    GstFlowReturn open_file();
    GstFlowReturn find_config();
    void close_file();
    GstFlowReturn expose();
    void push_tags();
    void add_output(size_t index, OwnedCaps caps);
    GstFlowReturn push_frame();
    GstFlowReturn push_to(Output& output, GstBuffer* buffer, const flvdmx::Frame& frame);
    bool goes_back(int64_t position);
    void warn_of_skipped(int64_t position);
    void lengthen();
    void announce_config(const flvdmx::Frame& frame);
    GstFlowReturn source_failed();
    GstFlowReturn file_failed(const flvdmx::error& error);
    void push_segment();
    void push_to_all(GstEvent* event) const;
    bool has_output() const { return m_outputs[0].pad() != nullptr || m_outputs[1].pad() != nullptr; }
    static size_t index_of(flvdmx::Stream stream) { return stream == flvdmx::Stream::video ? 0 : 1; }
    Output& output_of(flvdmx::Stream stream) { return m_outputs[index_of(stream)]; }
    bool& warned_of(flvdmx::Stream stream) { return m_warned[index_of(stream)]; }

    /* Called by any thread. */
    static gboolean handle_event(GstPad* pad, GstObject* parent, GstEvent* event);
    static gboolean handle_query(GstPad* pad, GstObject* parent, GstQuery* query);
    /* `start` and `stop` are times in ns; a stop of -1 is the end of the file. */
    struct SeekRequest {
        gdouble rate = 1.0;
        GstSeekFlags flags = GST_SEEK_FLAG_NONE;
        GstSeekType start_type = GST_SEEK_TYPE_NONE; // or SET
        gint64 start = 0;
        gint64 stop = -1;
    };
    std::optional<SeekRequest> parse_seek(GstEvent* event) const;
    bool seek(GstEvent* event);
    bool seek_file(GstSegment& segment, GstSeekFlags flags);
    flvdmx::result<flvdmx::Milliseconds> go_to_keyframe(flvdmx::Milliseconds target, GstSeekFlags flags);
    flvdmx::result<flvdmx::Milliseconds> go_to(flvdmx::Milliseconds target, flvdmx::SeekMode mode);
    void continue_after_flush();
    void restart();
    unsigned begin_flush(guint32 sequence);
    bool end_flush(unsigned number, guint32 sequence);
    bool answer(GstQuery* query) const;

    static constexpr GstFlowReturn flow_reported = GST_FLOW_CUSTOM_ERROR; // a failure whose message was posted

    GstElement* const m_element;
    GstPad* const m_sink;
    Source m_source;
    std::unique_ptr<GstFlowCombiner, void (*)(GstFlowCombiner*)> m_combiner;

    /* Protected by the stream lock. */
    bool m_active = false;
    flvdmx::File m_file;
    flvdmx::Info m_info;
    flvdmx::Metadata m_metadata;
    std::unique_ptr<uint8_t[]> m_spare; // for frames whose size is not known beforehand
    std::array<Output, 2> m_outputs;    // video, audio
    int64_t m_next_tag = -1;            // where the reader stands; -1 after a seek
    guint32 m_sequence = 0;             // sequence number of the open or of the last seek, for all events
    bool m_segment_is_new = false;
    std::array<bool, 2> m_warned{}; // about tags that are not played: video, audio
    Timeline m_timeline;

    GstSegment m_segment{};                   // written under the stream lock and the object lock, read under either
    std::atomic<GstClockTime> m_position = 0; // of the last buffer pushed

    std::atomic<bool> m_seekable = false;
    std::atomic<int> m_waiting_seeks = 0; // for the stream lock

    std::mutex m_flush_mutex; // held while a flush begins or ends
    unsigned m_flushes = 0;   // number begun

    std::atomic<guint32> m_last_seek = GST_SEQNUM_INVALID; // each sink of a pipeline sends the same seek
};

} // namespace flvdmx_gst
