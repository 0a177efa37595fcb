// The shared blocks behind Values: reference-counted nodes for data, URLs,
// objects and heap collections, and the arena that holds a whole document.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>

#include "kivi/base/value.h"

namespace kivi::detail {

// A document's arena: blocks carved front to back, freed together when the
// last Value that reaches into it goes.
class DocumentArena {
 public:
  static DocumentArena* create(std::size_t sizeHint);

  void retain() noexcept { references_.fetch_add(1, std::memory_order_relaxed); }
  void release() noexcept {
    if (references_.fetch_sub(1, std::memory_order_acq_rel) == 1) destroy();
  }

  void* allocate(std::size_t bytes) {
    bytes = (bytes + 7) & ~std::size_t{7};
    if (static_cast<std::size_t>(limit_ - cursor_) < bytes) addBlock(bytes);
    void* p = cursor_;
    cursor_ += bytes;
    return p;
  }

 private:
  struct Block {
    Block* next;
  };
  DocumentArena() = default;
  void addBlock(std::size_t atLeast);
  void destroy() noexcept;

  std::atomic<std::size_t> references_{1};
  char* cursor_ = nullptr;
  char* limit_ = nullptr;
  Block* blocks_ = nullptr;  // the first block holds this arena itself
  std::size_t nextBlockSize_ = 0;
};

// The header of every shared block a Value points to. A node in an arena
// counts nothing itself: copies hold the arena.
struct ValueNode {
  std::atomic<std::uint32_t> references{1};
  DocumentArena* arena = nullptr;
};

struct DataNode : ValueNode {
  explicit DataNode(Data d) : data(std::move(d)) {}
  Data data;
};
struct ArrayNode : ValueNode {
  ArrayNode() = default;
  explicit ArrayNode(Array a) : array(std::move(a)) {}
  Array array;
};
struct DictionaryNode : ValueNode {
  DictionaryNode() = default;
  explicit DictionaryNode(Dictionary d) : dictionary(std::move(d)) {}
  Dictionary dictionary;
};
struct ObjectNode : ValueNode {
  explicit ObjectNode(std::shared_ptr<Object> o) : object(std::move(o)) {}
  std::shared_ptr<Object> object;
};
struct URLNode : ValueNode {
  explicit URLNode(std::shared_ptr<const Object> u) : url(std::move(u)) {}
  std::shared_ptr<const Object> url;
};

}  // namespace kivi::detail
