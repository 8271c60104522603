// threadRunner.h - a thread that runs the test's closures on itself.
//
// The priority mapper and processor assignment act on the calling thread,
// so tests need threads of their own to register and place.  run() hands a
// closure to the thread and waits for its result; the thread ends with the
// runner.  Its pthread_t stays valid for the runner's whole life.
#pragma once

#include <pthread.h>
#include <sched.h>

#include <condition_variable>
#include <functional>
#include <mutex>
#include <thread>
#include <type_traits>

namespace testsupport {

class ThreadRunner {
public:
    ThreadRunner() : thread_([this] { loop(); })
    {
        handle_ = thread_.native_handle();
    }
    ~ThreadRunner()
    {
        {
            std::lock_guard<std::mutex> lock(mutex_);
            stopping_ = true;
        }
        wake_.notify_all();
        thread_.join();
    }
    ThreadRunner(const ThreadRunner&) = delete;
    ThreadRunner& operator=(const ThreadRunner&) = delete;

    template <class F>
    auto run(F&& f) -> decltype(f())
    {
        using R = decltype(f());
        if constexpr (std::is_void_v<R>) {
            submit([&] { f(); });
        } else {
            R result{};
            submit([&] { result = f(); });
            return result;
        }
    }

    pthread_t handle() const { return handle_; }

    // Read from outside, as the mapper reads other threads.
    int linuxPriority() const
    {
        int policy = 0;
        sched_param param{};
        pthread_getschedparam(handle_, &policy, &param);
        return param.sched_priority;
    }
    int policy() const
    {
        int policy = 0;
        sched_param param{};
        pthread_getschedparam(handle_, &policy, &param);
        return policy;
    }

private:
    void submit(std::function<void()> job)
    {
        std::unique_lock<std::mutex> lock(mutex_);
        job_ = std::move(job);
        done_ = false;
        wake_.notify_all();
        wake_.wait(lock, [this] { return done_; });
    }

    void loop()
    {
        std::unique_lock<std::mutex> lock(mutex_);
        for (;;) {
            wake_.wait(lock, [this] { return stopping_ || job_; });
            if (!job_) {
                // End as an ordinary thread: a real-time thread spinning in
                // a sanitizer's lock at exit could starve its holder.
                sched_param normal{};
                pthread_setschedparam(pthread_self(), SCHED_OTHER, &normal);
                return;
            }
            std::function<void()> job = std::move(job_);
            job_ = nullptr;
            lock.unlock();
            job();
            lock.lock();
            done_ = true;
            wake_.notify_all();
        }
    }

    std::mutex mutex_;
    std::condition_variable wake_;
    std::function<void()> job_;
    bool done_ = false;
    bool stopping_ = false;
    std::thread thread_;
    pthread_t handle_{};
};

}  // namespace testsupport
