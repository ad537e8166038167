/*
 * The one rule of the library for threads: no file is opened beside any other call, because an open writes the tables
 * of host functions and the globals of errors. Opens take the lock exclusively, all other calls share it.
 *
 * While a call waits for its source, it touches none of these, and every open writes the same tables. It therefore
 * releases the lock until the source has answered, so that a source that blocks stops nobody else.
 */
#pragma once

#include "flvdmx/flvdmx.hpp"

#include <atomic>
#include <mutex>
#include <shared_mutex>

namespace flvdmx_gst {

class OpenLock {
public:
    void lock()
    {
        ++m_waiting;
        {
            const std::lock_guard<std::mutex> gate(m_gate);
            m_lock.lock();
        }
        --m_waiting;
        s_held = Held::exclusively;
    }
    void unlock()
    {
        s_held = Held::not_at_all;
        m_lock.unlock();
    }

    // Lets a waiting open go first: elements that play without a pause would always leave one of them inside.
    void lock_shared()
    {
        if (m_waiting != 0)
            const std::lock_guard<std::mutex> gate(m_gate);
        m_lock.lock_shared();
        s_held = Held::shared;
    }
    void unlock_shared()
    {
        s_held = Held::not_at_all;
        m_lock.unlock_shared();
    }

    /** Releases what the thread holds, and takes it again at its end. A thread that holds the lock exclusively is in
     *  File::open(), whose mutex it releases as well. */
    class Pause {
    public:
        Pause();
        ~Pause();
        Pause(const Pause&) = delete;
        Pause& operator=(const Pause&) = delete;

    private:
        enum class Held { not_at_all, shared, exclusively };
        friend OpenLock;

        const Held m_held;
    };

private:
    using Held = Pause::Held;

    std::mutex m_gate; // held by an open that waits
    std::shared_mutex m_lock;
    std::atomic<int> m_waiting = 0;
    inline static thread_local Held s_held = Held::not_at_all;
};

inline OpenLock open_lock;

inline OpenLock::Pause::Pause() : m_held(s_held)
{
    if (m_held == Held::shared) {
        open_lock.unlock_shared();
    } else if (m_held == Held::exclusively) {
        flvdmx::open_mutex.unlock();
        open_lock.unlock();
    }
}

inline OpenLock::Pause::~Pause()
{
    if (m_held == Held::shared) {
        open_lock.lock_shared();
    } else if (m_held == Held::exclusively) {
        open_lock.lock();
        flvdmx::open_mutex.lock();
    }
}

} // namespace flvdmx_gst
