// A first-in-first-out list of work items in chunks, which gives the room of taken items to later ones: a queue in
// steady use allocates nothing, and a long backlog is never moved. Not thread-safe.
#pragma once

#include "platform/WorkQueue.h"

#include <cassert>
#include <cstddef>
#include <memory>
#include <utility>

namespace vela::platform {

class ItemFifo {
public:
    ItemFifo() = default;
    ~ItemFifo() { clear(); }
    ItemFifo(const ItemFifo&) = delete;
    ItemFifo& operator=(const ItemFifo&) = delete;

    bool empty() const { return size_ == 0; }
    std::size_t size() const { return size_; }

    void push(WorkItem&& item) {
        if (tail_ == nullptr || tailIndex_ == kItemsPerChunk) {
            appendChunk();
        }
        tail_->items[tailIndex_++] = std::move(item);
        ++size_;
    }

    /// Takes the oldest item, which must be there.
    WorkItem take() {
        assert(!empty());
        WorkItem item = std::move(head_->items[headIndex_++]);
        --size_;
        if (size_ == 0 && head_.get() == tail_) {
            headIndex_ = 0;
            tailIndex_ = 0;
        } else if (headIndex_ == kItemsPerChunk) {
            dropFirstChunk();
        }
        return item;
    }

    void swap(ItemFifo& other) noexcept {
        std::swap(head_, other.head_);
        std::swap(tail_, other.tail_);
        std::swap(spare_, other.spare_);
        std::swap(headIndex_, other.headIndex_);
        std::swap(tailIndex_, other.tailIndex_);
        std::swap(size_, other.size_);
    }

    /// Destroys every item in order.
    void clear() {
        while (!empty()) {
            take();
        }
    }

private:
    static constexpr std::size_t kItemsPerChunk = 16;

    struct Chunk {
        std::unique_ptr<Chunk> next;
        WorkItem items[kItemsPerChunk];
    };

    void appendChunk() {
        std::unique_ptr<Chunk> chunk = spare_ != nullptr ? std::move(spare_) : std::make_unique<Chunk>();
        Chunk* const last = chunk.get();
        if (tail_ == nullptr) {
            head_ = std::move(chunk);
            headIndex_ = 0;
        } else {
            tail_->next = std::move(chunk);
        }
        tail_ = last;
        tailIndex_ = 0;
    }

    void dropFirstChunk() {
        std::unique_ptr<Chunk> first = std::move(head_);
        head_ = std::move(first->next);
        headIndex_ = 0;
        if (head_ == nullptr) {
            tail_ = nullptr;
        }
        if (spare_ == nullptr) {
            spare_ = std::move(first);
        }
    }

    std::unique_ptr<Chunk> head_;
    Chunk* tail_ = nullptr;
    std::unique_ptr<Chunk> spare_;
    std::size_t headIndex_ = 0;
    std::size_t tailIndex_ = 0;
    std::size_t size_ = 0;
};

} // namespace vela::platform
