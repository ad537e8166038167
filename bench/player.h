/* What the bench compares: players that open a file, play it and seek in it. */
#pragma once

#include <cstdint>
#include <memory>
#include <string>

namespace flvd_bench {

/** Frames delivered and their bytes; players that deliver the same frames agree in both. */
struct Tally {
    uint64_t frames = 0;
    uint64_t bytes = 0;

    void add(uint32_t size)
    {
        ++frames;
        bytes += size;
    }
};

class Player {
public:
    Player() = default;
    virtual ~Player() = default;
    Player(const Player&) = delete;
    Player& operator=(const Player&) = delete;

    /** Opens a file; closes one that is open. @return whether it can be played */
    virtual bool open(const std::string& path) = 0;
    virtual void close() = 0;
    /** Plays from the current position to the end. */
    virtual Tally play() = 0;
    /** Seeks to the keyframe at or before `time_ms` and gets its frame. @return frame size, 0 on failure */
    virtual uint32_t seek(int32_t time_ms) = 0;
};

using PlayerPtr = std::unique_ptr<Player>;

/**
 * Plays through C streams and checks nothing: reads a tag header, copies the data once, reads the back-pointer. This is
 * the least that any player must do. It cannot seek.
 */
PlayerPtr MakeTrustingPlayer();

/** How much libavformat does when it opens a file. */
enum class LibavformatOpen {
    Bare,        /**< finds no streams yet */
    StreamInfo,  /**< finds the least stream information */
    StreamsKnown /**< reads until the first picture has revealed the streams, for seeking */
};

/** Null without libavformat. Parsing and frame completion are switched off. */
PlayerPtr MakeLibavformatPlayer(LibavformatOpen how);

} // namespace flvd_bench
