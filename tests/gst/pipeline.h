/*
 * Pipelines of the tests: run from a description, with what arrives at their sinks.
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

/** A file of the temporary folder, which is removed in the end. */
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
    GstClockTime segment_start = 0; /**< of the segment in force */
    GstClockTime segment_base = 0;  /**< likewise */
    std::string checksum;           /**< of the bytes */
    std::string caps;               /**< in force */
};

/** A pipeline whose appsinks keep all that arrives. Ends when it goes. */
class Pipeline {
public:
    /** From the words of gst-launch-1.0. */
    explicit Pipeline(const std::string& description);
    ~Pipeline();
    Pipeline(const Pipeline&) = delete;
    Pipeline& operator=(const Pipeline&) = delete;

    GstElement* element() const { return m_pipeline; }
    /** Goes to a state, where a paused pipeline keeps the first buffers as well, and waits for it. False when that
     * failed or took longer than ten seconds. */
    bool go_to(GstState state);
    /** Plays until a message of one of these types; null after 30 seconds. */
    GstMessage* play_until(int types);
    /** Plays to the end, or to a message of a type that carries a text. Returns that text or the error's, else "". */
    std::string play(int types = GST_MESSAGE_EOS);
    /** A seek in time, in milliseconds; `stop` -1: to the end. */
    bool seek(int64_t start, int flags, int64_t stop = -1, double rate = 1.0);
    /** What has arrived at the appsink of that name. */
    std::vector<Arrival> arrivals(const char* sink);
    /** Decoding time of the last one there; 0 without any. */
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

/** filesrc and the demuxer `d`, with these branches for `video` and `audio`; an empty one is left out. */
std::string demuxed(const std::string& path, const std::string& video, const std::string& audio,
                    const std::string& demuxer = "flvdmxdemux");

} // namespace flvd_test
