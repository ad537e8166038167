/* What the bench compares: something that opens a file, plays it and seeks in it. */
#pragma once

#include <cstdint>
#include <memory>
#include <string>

namespace flvd_bench {

/** Frames delivered; players that deliver the same must agree in both. */
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

    /** A player that is open already is closed first. @return whether it can play */
    virtual bool open(const std::string& path) = 0;
    virtual void close() = 0;
    /** Frames from here to the end. */
    virtual Tally play() = 0;
    /** Goes to the keyframe at or before `time_ms` and takes its frame. @return frame size, 0 when it failed */
    virtual uint32_t seek(int32_t time_ms) = 0;
};

using PlayerPtr = std::unique_ptr<Player>;

/**
 * Plays through C streams and checks nothing: a tag header, one copy of the data, the back-pointer. What any player has
 * to do at least. It does not seek.
 */
PlayerPtr MakeTrustingPlayer();

/** How far libavformat goes when it opens. */
enum class LibavformatOpen {
    Bare,        /**< no streams yet */
    StreamInfo,  /**< the least of its stream information */
    StreamsKnown /**< until the first picture told it of its streams, for seeking */
};

/** Null without libavformat. It neither parses nor fills in. */
PlayerPtr MakeLibavformatPlayer(LibavformatOpen how);

} // namespace flvd_bench
