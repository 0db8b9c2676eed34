#pragma once
// Work that must outlast its answer runs on a detached worker thread.

#include <atomic>
#include <cstdint>

// Starts fn(arg) on a new thread with default attributes; the worker detaches itself.
// Returns pthread_create's result (0 on success).
int start_worker(void *(*fn)(void *), void *arg);
// Waits until every worker started with start_worker has returned; false if some are
// still running after timeout_ms (a test waits for them before its sandbox goes).
bool wait_workers_done(int timeout_ms);

// A worker that writes frames to the station calls this before its first one: the
// dispatcher holds its mutex until the answer of the line that started the worker has
// left, so the station always sees that answer first.
void wait_for_current_answer();

// A stop and a quick restart can find the old worker still asleep in its pass, with the
// running flag raised again by then. Each worker carries the generation it was started in
// (as its argument) and, once that generation is over, ends without touching what now
// belongs to its successor.
struct WorkerGeneration {
    std::atomic<unsigned> latest{0};
    void *next() { return as_arg(++latest); }            // a new generation, for a new worker
    void *now() const { return as_arg(latest.load()); }  // the running one
    void end() { ++latest; }                             // the running one is over
    bool current(void *arg) const { return arg == now(); }
    static void *as_arg(unsigned g) { return reinterpret_cast<void *>(static_cast<uintptr_t>(g)); }
};

// Restarts the device two seconds after the answer has left; arg is a reason text or null.
void *reboot_thread(void *reason);

