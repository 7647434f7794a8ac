#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <new>
#include <utility>

namespace kx {

// Memory for very many records that are made one after the other, by one thread. The records live
// as long as they like and end on any thread, also after this: a block of memory is freed with the
// last of its records.
class RecordBlocks {
 public:
  RecordBlocks() = default;
  RecordBlocks(const RecordBlocks&) = delete;
  RecordBlocks& operator=(const RecordBlocks&) = delete;
  ~RecordBlocks() { close(); }

  template <typename T, typename... Arguments>
  std::shared_ptr<T> make(Arguments&&... arguments) {
    static_assert(sizeof(T) + kCountBytes <= kMostBytes && alignof(T) <= kAlign);
    if (block_ == nullptr || kBlockBytes - block_->used < kMostBytes) begin();
    ++taken_;
    return std::allocate_shared<T>(Allocator<T>(block_), std::forward<Arguments>(arguments)...);
  }

 private:
  struct Block {
    std::atomic<std::uint32_t> users;  // records, and as long as it is filled all that may come
    std::uint32_t used;                // bytes, these included
  };
  static constexpr std::size_t kBlockBytes = (std::size_t{64} << 10) - 64;
  static constexpr std::size_t kMostBytes = 512;   // of a record with its counts
  static constexpr std::size_t kCountBytes = 128;  // more than stands beside a shared record
  static constexpr std::size_t kAlign = alignof(std::uint64_t);
  static constexpr std::uint32_t kMostUsers = kBlockBytes;
  static_assert(sizeof(Block) % kAlign == 0);

  // Takes from a block with room for one more.
  template <typename T>
  struct Allocator {
    using value_type = T;
    explicit Allocator(Block* from) : block(from) {}
    template <typename U>
    Allocator(const Allocator<U>& other) : block(other.block) {}
    T* allocate(std::size_t count) {
      static_assert(sizeof(T) <= kMostBytes && alignof(T) <= kAlign);
      if (count != 1) throw std::bad_alloc();
      void* const memory = reinterpret_cast<char*>(block) + block->used;
      block->used += static_cast<std::uint32_t>((sizeof(T) + kAlign - 1) / kAlign * kAlign);
      return static_cast<T*>(memory);
    }
    void deallocate(T* /*memory*/, std::size_t /*count*/) noexcept { release(block, 1); }
    template <typename U>
    bool operator==(const Allocator<U>& other) const {
      return block == other.block;
    }
    Block* block;
  };

  void begin() {
    close();
    block_ = new (::operator new(kBlockBytes)) Block{kMostUsers, sizeof(Block)};
  }
  void close() noexcept {
    if (block_ != nullptr) release(block_, kMostUsers - taken_);
    block_ = nullptr;
    taken_ = 0;
  }
  static void release(Block* block, std::uint32_t users) noexcept {
    if (block->users.fetch_sub(users, std::memory_order_acq_rel) != users) return;
    block->~Block();
    ::operator delete(block);
  }

  Block* block_ = nullptr;
  std::uint32_t taken_ = 0;
};

}  // namespace kx
