#pragma once

#include <cstddef>
#include <exception>
#include <functional>
#include <string>
#include <vector>

#include <boost/multi_index/hashed_index.hpp>
#include <boost/multi_index/sequenced_index.hpp>
#include <boost/multi_index_container.hpp>

#include <marubackup/job.h>

#include "job/job_record.h"

namespace MARU {
namespace Backup {

/**
 * One queue of the store: its jobs in the order of their arrival, found by id
 * and by unique string without a walk over those that wait.
 *
 * Jobs are handed out to be read. They are changed by change() alone, which
 * looks at the job again afterwards, so that what is found here is always what
 * is there. References and iterators are good until their job is erased.
 */
class JobQueue {
    struct IdOf {
        using result_type = int;
        result_type operator()(const Job& job) const {
            return job.getJobId();
        }
    };

    struct UniqueOf {
        using result_type = std::string;
        const result_type& operator()(const Job& job) const {
            return recordOf(job).unique;
        }
    };

    struct ByArrival {};
    struct ById {};
    struct ByUnique {};

    // Neither key is unique: ids start again when they are used up, and nothing
    // keeps a backend from giving all its jobs the same unique string but the
    // refusal at admission, which is not made here.
    using Jobs = boost::multi_index_container<
        Job, boost::multi_index::indexed_by<
                 boost::multi_index::sequenced<boost::multi_index::tag<ByArrival>>,
                 boost::multi_index::hashed_non_unique<boost::multi_index::tag<ById>, IdOf, std::hash<int>>,
                 boost::multi_index::hashed_non_unique<boost::multi_index::tag<ByUnique>, UniqueOf,
                                                       std::hash<std::string>>>>;

public:
    using const_iterator = Jobs::const_iterator;

    JobQueue() = default;
    JobQueue(const JobQueue&) = delete;
    JobQueue& operator=(const JobQueue&) = delete;

    // In the order of arrival

    const_iterator begin() const {
        return jobs.begin();
    }
    const_iterator end() const {
        return jobs.end();
    }
    const Job& front() const {
        return jobs.front();
    }
    const Job& back() const {
        return jobs.back();
    }
    bool empty() const {
        return jobs.empty();
    }
    std::size_t size() const {
        return jobs.size();
    }

    /** The place of a job of this queue. */
    const_iterator placeOf(const Job& job) const {
        return jobs.iterator_to(job);
    }

    // What is in it

    /** Appends a copy. */
    void push_back(const Job& job);

    /** Erases a job; the place of the next. */
    const_iterator erase(const_iterator job);

    void clear();

    /**
     * Calls change(Job&) for a job of this queue, which may change anything in
     * it, and finds the job by what it is then; also if that throws.
     */
    template <typename Change>
    void change(const_iterator job, Change change) {
        std::exception_ptr thrown;
        notWaiting -= countOf(*job);
        jobs.modify(job, [&](Job& changed) {
            // A job that cannot be changed stays; the container would drop it.
            try {
                change(changed);
            } catch (...) {
                thrown = std::current_exception();
            }
        });
        notWaiting += countOf(*job);
        if (thrown) {
            std::rethrow_exception(thrown);
        }
    }

    // Without a walk

    /** The first job with that id; null if there is none. */
    const Job* withId(int id) const;

    /** All jobs with that unique string, in the order of arrival. */
    std::vector<const Job*> withUnique(const std::string& unique) const;

    bool hasUnique(const std::string& unique) const;

    static bool isWaiting(const Job& job) {
        return job.getStatus() == Job::STATUS_QUEUED;
    }

    /**
     * How many jobs have another status than queued. As jobs are launched from
     * the front, who looks for these has met them all before those that wait.
     */
    std::size_t countNotWaiting() const {
        return notWaiting;
    }

private:
    /** What a job adds to notWaiting. */
    static std::size_t countOf(const Job& job) {
        return isWaiting(job) ? 0 : 1;
    }

    Jobs jobs;
    std::size_t notWaiting = 0;
};

} // namespace Backup
} // namespace MARU
