// TicketList.h - a fixed table of seats handed out as small-integer tickets.
//
// The library's one instance, g_alarmTable, holds a PerThreadData record per
// timed structure.  Tickets count up from 0 until one is returned; from then
// on the most recently returned ticket is handed out first.  mutex_ guards
// the bookkeeping (sold_ flags, nextUnused_, freeTickets_) and the reads of
// name and state in findActiveByName; it does not guard the records, which
// belong to their structures' threads.  Buying and returning never allocate.
#pragma once

#include <cstddef>
#include <string>
#include <vector>

#include "Mutex.h"
#include "pxAssert.h"
#include "schedExceptions.h"

namespace pxalarms {

template <class TicketType, class ObjectType>
class TicketList {
public:
    explicit TicketList(size_t capacity) : seats_(capacity), nextUnused_(0), noTicket_(-1)
    {
        freeTickets_.reserve(capacity);
    }
    TicketList(const TicketList&) = delete;
    TicketList& operator=(const TicketList&) = delete;

    // A fresh ticket, or -1 when every seat is sold.
    TicketType buyTicketNoThrow()
    {
        MutexLock lock(mutex_);
        TicketType i;
        if (!freeTickets_.empty()) {
            i = freeTickets_.back();
            freeTickets_.pop_back();
        } else if (static_cast<size_t>(nextUnused_) < seats_.size()) {
            i = nextUnused_++;
        } else {
            return noTicket_;
        }
        PX_ASSERT(!seats_[i].sold_);
        seats_[i].sold_ = true;
        seats_[i].object_.state.store(0, std::memory_order_release);
        return i;
    }

    // The record of a sold ticket; throws TicketOutOfRange otherwise.  The
    // reference stays valid after the lock is released: seats never move.
    ObjectType& getObject(TicketType ticket)
    {
        MutexLock lock(mutex_);
        if (!isValid(ticket))
            throw TicketOutOfRange();
        return seats_[ticket].object_;
    }

    bool returnTicket(TicketType ticket)
    {
        MutexLock lock(mutex_);
        if (!isValid(ticket))
            return false;
        seats_[ticket].sold_ = false;
        freeTickets_.push_back(ticket);  // never reallocates: capacity reserved
        return true;
    }

    // The first sold seat whose record is active (state > 0) under this name.
    TicketType findActiveByName(const std::string& name)
    {
        MutexLock lock(mutex_);
        for (TicketType i = 0; i < nextUnused_; ++i) {
            const Seat& seat = seats_[i];
            if (seat.sold_ && seat.object_.state.load(std::memory_order_acquire) > 0 &&
                seat.object_.name == name)
                return i;
        }
        return noTicket_;
    }

    size_t capacity() const { return seats_.size(); }

private:
    struct Seat {
        ObjectType object_;
        bool sold_ = false;
    };

    // Caller holds mutex_.
    bool isValid(TicketType ticket) const
    {
        return ticket >= 0 && ticket < nextUnused_ && seats_[ticket].sold_;
    }

    std::vector<Seat> seats_;          // fixed length; guarded by mutex_ (sold_)
    TicketType nextUnused_;            // guarded by mutex_
    std::vector<TicketType> freeTickets_;  // a stack; guarded by mutex_
    const TicketType noTicket_;
    Mutex mutex_;
};

}  // namespace pxalarms
