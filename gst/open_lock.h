/*
 * The library's one rule for threads: no file is opened at the same time as any other call, because an open writes the
 * tables of host functions and the global error variables. Opens take the lock exclusively, all other calls share it.
 *
 * While a call waits for its source, it uses none of these, and every open writes the same tables. Such a call
 * therefore releases the lock until the source has answered, so that a source that blocks does not stop other elements.
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

    // Lets a waiting open go first. Otherwise, elements that play without a pause could hold the lock forever.
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

    /** Releases the thread's lock during its lifetime. A thread that holds the lock exclusively is in File::open(),
     *  whose mutex is released as well. */
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

    std::mutex m_gate; // held by a waiting open
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
