#pragma once

/**
 * Sees to it that one daemon at a time serves the socket: runQueueServer() would
 * take the path away from the one that serves it, whose jobs nobody could ask
 * about any more.
 *
 * The lock is on /var/run/marubackupd.lock and holds the daemon's process id for
 * those who look. The file itself says nothing: it stays when the daemon ends,
 * and is emptied then.
 */
class InstanceLock {
public:
    InstanceLock() = default;
    ~InstanceLock();
    InstanceLock(const InstanceLock&) = delete;
    InstanceLock& operator=(const InstanceLock&) = delete;

    /** True if the lock is ours now, until this object's end. If not, the operator was told why. */
    bool acquire();

private:
    int descriptor = -1;
    bool held = false;
};
