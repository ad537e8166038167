/*
 * Test pipelines: made from a description, with a record of what arrives at their sinks.
 */
#pragma once

#include <gst/app/gstappsink.h>
#include <gst/gst.h>
#include <gtest/gtest.h>

#include "support/flv_writer.h"

#include <atomic>
#include <cstdint>
#include <filesystem>
#include <fstream>
#include <map>
#include <memory>
#include <mutex>
#include <ostream>
#include <string>
#include <vector>

namespace flvd_test {

/** A file in the temporary folder, which is removed at the end. */
class TemporaryFile {
public:
    TemporaryFile()
        : m_path(testing::TempDir() + "flvdmx-" + std::to_string(getpid()) + "-" + std::to_string(++s_number))
    {
    }
    explicit TemporaryFile(const Bytes& bytes) : TemporaryFile()
    {
        std::ofstream(m_path, std::ios::binary)
            .write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
    }
    ~TemporaryFile() { std::filesystem::remove(m_path); }
    TemporaryFile(const TemporaryFile&) = delete;
    TemporaryFile& operator=(const TemporaryFile&) = delete;
    const std::string& path() const { return m_path; }

private:
    inline static int s_number = 0;
    std::string m_path;
};

/** What arrived in one buffer. */
struct Arrival {
    GstClockTime dts = GST_CLOCK_TIME_NONE;
    GstClockTime pts = GST_CLOCK_TIME_NONE;
    uint64_t offset = 0; /**< GST_BUFFER_OFFSET */
    bool discont = false;
    bool delta = false;
    GstClockTime segment_start = 0; /**< of the current segment */
    GstClockTime segment_base = 0;  /**< likewise */
    std::string checksum;           /**< of the bytes */
    std::string caps;               /**< the current ones */
};

/** A pipeline whose appsinks record everything that arrives. Stopped by the destructor. */
class Pipeline {
public:
    /** Makes a pipeline from a description in the syntax of gst-launch-1.0. */
    explicit Pipeline(const std::string& description);
    ~Pipeline();
    Pipeline(const Pipeline&) = delete;
    Pipeline& operator=(const Pipeline&) = delete;

    GstElement* element() const { return m_pipeline; }
    /** Changes the state and waits for it; a pipeline that is paused also records the first buffers. Returns false if
     * that failed or took longer than ten seconds. */
    bool go_to(GstState state);
    /** Plays until a message of one of these types arrives. Returns it, or null after 30 seconds. */
    GstMessage* play_until(int types);
    /** Plays to the end, or to a message of these types. Returns the text of the warning or error, or "". */
    std::string play(int types = GST_MESSAGE_EOS);
    /** Seeks to a time in milliseconds; `stop` -1: to the end. */
    bool seek(int64_t start, int flags, int64_t stop = -1, double rate = 1.0);
    /** Returns what has arrived at the appsink of that name. */
    std::vector<Arrival> arrivals(const char* sink);
    /** Returns the decoding time of the last buffer there, or 0. */
    GstClockTime last_time(const char* sink);
    void forget_arrivals();

private:
    static GstFlowReturn take(GstAppSink* sink, gpointer pipeline);
    static GstFlowReturn take_preroll(GstAppSink* sink, gpointer pipeline);
    void keep(GstAppSink* sink, GstSample* sample);

    GstElement* m_pipeline;
    std::atomic<bool> m_keeps_preroll = false;
    std::mutex m_mutex;
    std::map<std::string, std::vector<Arrival>> m_arrivals;
};

/** Describes filesrc and the demuxer `d`, with these branches for `video` and `audio`; an empty one is omitted. */
std::string demuxed(const std::string& path, const std::string& video, const std::string& audio,
                    const std::string& demuxer = "flvdmxdemux");

} // namespace flvd_test
