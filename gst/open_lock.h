/*
 * The one rule of the library for threads: no file is opened beside any other call. Opens take the lock exclusively,
 * all other calls share it. It is held while the source is read: an open waits for a source that blocks.
 */
#pragma once

#include <atomic>
#include <chrono>
#include <shared_mutex>
#include <thread>

namespace flvdmx_gst {

class OpenLock {
public:
    void lock()
    {
        ++m_waiting;
        m_lock.lock();
        --m_waiting;
    }
    void unlock() { m_lock.unlock(); }

    // A pause lets a waiting open in: elements that play without a pause would always leave one of them inside. It is
    // short, so that an open that has to wait for a blocked source does not stop those that are not blocked.
    void lock_shared()
    {
        if (m_waiting != 0)
            std::this_thread::sleep_for(std::chrono::milliseconds(1));
        m_lock.lock_shared();
    }
    void unlock_shared() { m_lock.unlock_shared(); }

private:
    std::shared_mutex m_lock;
    std::atomic<int> m_waiting = 0;
};

inline OpenLock open_lock;

} // namespace flvdmx_gst
