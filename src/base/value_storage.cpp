// Storage of Values: strings, shared nodes, arrays, dictionaries and the
// document arena with its builder.
#include <algorithm>
#include <cstdlib>
#include <limits>
#include <new>
#include <ostream>
#include <stdexcept>
#include <utility>
#include <vector>

#include "kivi/base/detail/document_builder.h"
#include "kivi/base/value.h"
#include "value_nodes.h"

namespace kivi {

using detail::ArrayNode;
using detail::DataNode;
using detail::DictionaryNode;
using detail::DocumentArena;
using detail::ObjectNode;
using detail::URLNode;
using detail::ValueNode;

namespace {

// A shared string's text follows this header.
struct StringHeader {
  std::atomic<std::size_t> references;
};

StringHeader* headerOf(const void* chars) noexcept {
  return reinterpret_cast<StringHeader*>(const_cast<char*>(static_cast<const char*>(chars)) -
                                         sizeof(StringHeader));
}

std::uint32_t checkedCount(std::size_t n) {
  if (n > std::numeric_limits<std::uint32_t>::max())
    throw std::length_error("collection too large");
  return static_cast<std::uint32_t>(n);
}

bool keyLess(const DictionaryEntry& a, const DictionaryEntry& b) noexcept {
  return a.first.view() < b.first.view();
}

// Sorts entries by key, keeping the order of equal keys.
void stableSortByKey(DictionaryEntry* first, DictionaryEntry* last) {
  if (last - first < 2) return;  // (an empty vector's entries may be null)
  if (last - first <= 24) {
    for (DictionaryEntry* i = first + 1; i < last; ++i) {
      if (!keyLess(*i, i[-1])) continue;
      DictionaryEntry moving = std::move(*i);
      DictionaryEntry* j = i;
      for (; j > first && keyLess(moving, j[-1]); --j) *j = std::move(j[-1]);
      *j = std::move(moving);
    }
    return;
  }
  std::stable_sort(first, last, keyLess);
}

// Drops all but one of each run of equal keys (sorted entries); returns the
// new end. The entries past it are left moved-from.
DictionaryEntry* dropDuplicateKeys(DictionaryEntry* first, DictionaryEntry* last, bool lastWins) {
  DictionaryEntry* out = first;
  for (DictionaryEntry* i = first; i < last;) {
    DictionaryEntry* runEnd = i + 1;
    while (runEnd < last && runEnd->first == runEnd[-1].first.view()) ++runEnd;
    DictionaryEntry* kept = lastWins ? runEnd - 1 : i;
    if (out != kept) *out = std::move(*kept);
    ++out;
    i = runEnd;
  }
  return out;
}

// Releases collections one after another, never recursively: a collection
// dropped while another one is (by the destruction of its elements) waits in
// `pending` for the loop in releaseNode().
thread_local std::vector<std::pair<Value::Kind, ValueNode*>>* pending = nullptr;

void deleteNode(Value::Kind kind, ValueNode* node) noexcept {
  switch (kind) {
    case Value::Kind::Data:
      delete static_cast<DataNode*>(node);
      break;
    case Value::Kind::Array:
      delete static_cast<ArrayNode*>(node);
      break;
    case Value::Kind::Dictionary:
      delete static_cast<DictionaryNode*>(node);
      break;
    case Value::Kind::Object:
      delete static_cast<ObjectNode*>(node);
      break;
    case Value::Kind::URL:
      delete static_cast<URLNode*>(node);
      break;
    default:
      break;
  }
}

void releaseNode(Value::Kind kind, ValueNode* node) noexcept {
  if (kind != Value::Kind::Array && kind != Value::Kind::Dictionary) return deleteNode(kind, node);
  if (pending != nullptr) {
    try {
      pending->emplace_back(kind, node);
      return;
    } catch (...) {  // out of memory: released here instead, recursively
      return deleteNode(kind, node);
    }
  }
  std::vector<std::pair<Value::Kind, ValueNode*>> waiting;
  pending = &waiting;
  deleteNode(kind, node);
  while (!waiting.empty()) {
    const auto [k, n] = waiting.back();
    waiting.pop_back();
    deleteNode(k, n);
  }
  pending = nullptr;
}

}  // namespace

// ---------------------------------------------------------------------------
// String

String::String(std::string_view text) {
  if (text.size() <= kInlineCapacity) {
    if (!text.empty()) std::memcpy(bytes_, text.data(), text.size());
    bytes_[kTagByte] = static_cast<char>(text.size());
    return;
  }
  char* block = static_cast<char*>(::operator new(sizeof(StringHeader) + text.size()));
  new (block) StringHeader{1};
  std::memcpy(block + sizeof(StringHeader), text.data(), text.size());
  setOutOfLine(block + sizeof(StringHeader), text.size(), kShared);
}

void String::copySlow(const String& other) {
  if (other.tag() == kShared) {
    headerOf(other.pointer())->references.fetch_add(1, std::memory_order_relaxed);
    std::memcpy(bytes_, other.bytes_, sizeof bytes_);
    return;
  }
  // Text in a document's arena: this copy gets its own.
  String copy(other.view());
  std::memcpy(bytes_, copy.bytes_, sizeof bytes_);
  copy.bytes_[kTagByte] = 0;
}

void String::releaseSlow() noexcept {
  if (tag() != kShared) return;
  StringHeader* header = headerOf(pointer());
  if (header->references.fetch_sub(1, std::memory_order_acq_rel) == 1) {
    header->~StringHeader();
    ::operator delete(header);
  }
}

std::ostream& operator<<(std::ostream& out, const String& s) { return out << s.view(); }

// ---------------------------------------------------------------------------
// Value

Value::Value(Data d) { setNode(Kind::Data, new DataNode(std::move(d))); }
Value::Value(Array a) { setNode(Kind::Array, new ArrayNode(std::move(a))); }
Value::Value(Dictionary d) { setNode(Kind::Dictionary, new DictionaryNode(std::move(d))); }
Value::Value(std::shared_ptr<Object> o) : Value() {
  if (o) setNode(Kind::Object, new ObjectNode(std::move(o)));
}

void Value::setURL(std::shared_ptr<const Object> url) {
  setNode(Kind::URL, new URLNode(std::move(url)));
}

const Data* Value::asData() const noexcept {
  return kind_ == Kind::Data ? &static_cast<DataNode*>(node())->data : nullptr;
}
const Array* Value::asArray() const noexcept {
  return kind_ == Kind::Array ? &static_cast<ArrayNode*>(node())->array : nullptr;
}
const Dictionary* Value::asDictionary() const noexcept {
  return kind_ == Kind::Dictionary ? &static_cast<DictionaryNode*>(node())->dictionary : nullptr;
}
const std::shared_ptr<Object>* Value::asObject() const noexcept {
  return kind_ == Kind::Object ? &static_cast<ObjectNode*>(node())->object : nullptr;
}
const std::shared_ptr<const Object>* Value::urlObject() const noexcept {
  return kind_ == Kind::URL ? &static_cast<URLNode*>(node())->url : nullptr;
}

void Value::copySlow(const Value& other) {
  if (other.kind_ == Kind::String) {
    new (raw_) String(*other.asString());
    kind_ = Kind::String;
    return;
  }
  ValueNode* n = other.node();
  if (n->arena != nullptr) {
    n->arena->retain();
  } else {
    n->references.fetch_add(1, std::memory_order_relaxed);
  }
  std::memcpy(static_cast<void*>(this), &other, sizeof(Value));
}

void Value::releaseSlow() noexcept {
  if (kind_ == Kind::String) {
    std::launder(reinterpret_cast<String*>(raw_))->~String();
    return;
  }
  ValueNode* n = node();
  if (n->arena != nullptr) {
    n->arena->release();
  } else if (n->references.fetch_sub(1, std::memory_order_acq_rel) == 1) {
    releaseNode(kind_, n);
  }
}

// ---------------------------------------------------------------------------
// Array

Array::Array(std::initializer_list<Value> values) {
  reserve(values.size());
  for (const Value& v : values) new (data_ + size_++) Value(v);
}

Array::Array(size_type count) { resize(count); }

Array::Array(size_type count, const Value& value) {
  reserve(count);
  for (size_type i = 0; i < count; ++i) new (data_ + size_++) Value(value);
}

Array::Array(const Array& other) {
  reserve(other.size_);
  for (const Value& v : other) new (data_ + size_++) Value(v);
}

Array& Array::operator=(const Array& other) {
  if (this != &other) *this = Array(other);
  return *this;
}

Array& Array::operator=(Array&& other) noexcept {
  if (this != &other) {
    this->~Array();
    new (this) Array(std::move(other));
  }
  return *this;
}

Array::~Array() {
  if (borrowed_) return;
  for (Value* v = data_; v != data_ + size_; ++v) v->~Value();
  ::operator delete(data_);
}

void Array::grow(size_type atLeast) {
  const size_type capacity =
      std::max<size_type>({atLeast, borrowed_ ? size_ : size_type{capacity_} * 2, 4});
  Value* data = static_cast<Value*>(::operator new(sizeof(Value) * checkedCount(capacity)));
  if (borrowed_) {
    for (size_type i = 0; i < size_; ++i) new (data + i) Value(data_[i]);
  } else {
    // Values move as bytes: none points into itself.
    if (size_ != 0) std::memcpy(static_cast<void*>(data), data_, sizeof(Value) * size_);
    ::operator delete(data_);
  }
  data_ = data;
  capacity_ = static_cast<std::uint32_t>(capacity);
  borrowed_ = false;
}

void Array::makeOwn() {
  if (borrowed_) grow(size_);
}

void Array::reserve(size_type n) {
  if (n > capacity_ || borrowed_) grow(std::max<size_type>(n, size_));
}

void Array::clear() noexcept {
  if (borrowed_) {
    data_ = nullptr;
    capacity_ = 0;
    borrowed_ = false;
  } else {
    for (Value* v = data_; v != data_ + size_; ++v) v->~Value();
  }
  size_ = 0;
}

void Array::resize(size_type n) {
  makeOwn();
  while (size_ > n) data_[--size_].~Value();
  if (n > size_) {
    reserve(n);
    while (size_ < n) new (data_ + size_++) Value();
  }
}

void Array::push_back(const Value& value) { emplace_back(value); }
void Array::push_back(Value&& value) { emplace_back(std::move(value)); }

void Array::pop_back() noexcept {
  if (borrowed_) {
    --size_;  // the arena keeps it
    return;
  }
  data_[--size_].~Value();
}

Array::iterator Array::insert(const_iterator position, Value value) {
  const size_type at = static_cast<size_type>(position - data_);
  if (size_ == capacity_ || borrowed_) grow(size_ + 1);
  std::memmove(static_cast<void*>(data_ + at + 1), data_ + at, sizeof(Value) * (size_ - at));
  new (data_ + at) Value(std::move(value));
  ++size_;
  return data_ + at;
}

Array::iterator Array::erase(const_iterator position) { return erase(position, position + 1); }

Array::iterator Array::erase(const_iterator first, const_iterator last) {
  const size_type from = static_cast<size_type>(first - data_);
  const size_type to = static_cast<size_type>(last - data_);
  if (from == to) return data_ + from;
  makeOwn();
  for (size_type i = from; i < to; ++i) data_[i].~Value();
  std::memmove(static_cast<void*>(data_ + from), data_ + to, sizeof(Value) * (size_ - to));
  size_ -= static_cast<std::uint32_t>(to - from);
  return data_ + from;
}

bool operator==(const Array& a, const Array& b) noexcept {
  return std::equal(a.begin(), a.end(), b.begin(), b.end());
}

// ---------------------------------------------------------------------------
// Dictionary

Dictionary::Dictionary(std::initializer_list<DictionaryEntry> entries) {
  adopt(std::vector<DictionaryEntry>(entries), /*lastWins=*/false);
}

void Dictionary::adopt(std::vector<DictionaryEntry> entries, bool lastWins) {
  DictionaryEntry* first = entries.data();
  DictionaryEntry* last = first + entries.size();
  stableSortByKey(first, last);
  last = dropDuplicateKeys(first, last, lastWins);
  clear();
  reserve(static_cast<size_type>(last - first));
  for (DictionaryEntry* e = first; e != last; ++e)
    new (data_ + size_++) DictionaryEntry(std::move(*e));
}

Dictionary::Dictionary(const Dictionary& other) {
  reserve(other.size_);
  for (const DictionaryEntry& e : other) new (data_ + size_++) DictionaryEntry(e);
}

Dictionary& Dictionary::operator=(const Dictionary& other) {
  if (this != &other) *this = Dictionary(other);
  return *this;
}

Dictionary& Dictionary::operator=(Dictionary&& other) noexcept {
  if (this != &other) {
    this->~Dictionary();
    new (this) Dictionary(std::move(other));
  }
  return *this;
}

Dictionary::~Dictionary() {
  if (borrowed_) return;
  for (DictionaryEntry* e = data_; e != data_ + size_; ++e) e->~DictionaryEntry();
  ::operator delete(data_);
}

void Dictionary::clear() noexcept {
  if (borrowed_) {
    data_ = nullptr;
    capacity_ = 0;
    borrowed_ = false;
  } else {
    for (DictionaryEntry* e = data_; e != data_ + size_; ++e) e->~DictionaryEntry();
  }
  size_ = 0;
}

void Dictionary::reserve(size_type n) {
  if (n <= capacity_ && !borrowed_) return;
  const size_type capacity = std::max<size_type>(n, size_);
  auto* data = static_cast<DictionaryEntry*>(
      ::operator new(sizeof(DictionaryEntry) * checkedCount(capacity)));
  if (borrowed_) {
    for (size_type i = 0; i < size_; ++i) new (data + i) DictionaryEntry(data_[i]);
  } else {
    if (size_ != 0) std::memcpy(static_cast<void*>(data), data_, sizeof(DictionaryEntry) * size_);
    ::operator delete(data_);
  }
  data_ = data;
  capacity_ = static_cast<std::uint32_t>(capacity);
  borrowed_ = false;
}

void Dictionary::makeOwn() {
  if (borrowed_) reserve(size_);
}

Dictionary::const_iterator Dictionary::lower_bound(std::string_view key) const noexcept {
  const DictionaryEntry* first = data_;
  std::size_t count = size_;
  while (count > 0) {
    const std::size_t half = count / 2;
    if (first[half].first.view() < key) {
      first += half + 1;
      count -= half + 1;
    } else {
      count = half;
    }
  }
  return first;
}

const Value& Dictionary::at(std::string_view key) const noexcept {
  static const Value absent;
  const_iterator it = find(key);
  return it != end() ? it->second : absent;
}

Dictionary::iterator Dictionary::insertAt(std::ptrdiff_t index, String key, Value value) {
  const auto at = static_cast<size_type>(index);
  if (size_ == capacity_ || borrowed_) {
    reserve(std::max<size_type>({size_type{size_} + 1, size_type{capacity_} * 2, 4}));
  }
  std::memmove(static_cast<void*>(data_ + at + 1), data_ + at,
               sizeof(DictionaryEntry) * (size_ - at));
  new (data_ + at) DictionaryEntry{std::move(key), std::move(value)};
  ++size_;
  return data_ + at;
}

Dictionary::iterator Dictionary::erase(const_iterator position) {
  const auto at = static_cast<size_type>(position - data_);
  makeOwn();
  data_[at].~DictionaryEntry();
  std::memmove(static_cast<void*>(data_ + at), data_ + at + 1,
               sizeof(DictionaryEntry) * (size_ - at - 1));
  --size_;
  return data_ + at;
}

Dictionary::size_type Dictionary::erase(std::string_view key) {
  const_iterator it = find(key);
  if (it == end()) return 0;
  erase(it);
  return 1;
}

bool operator==(const Dictionary& a, const Dictionary& b) noexcept {
  return std::equal(a.begin(), a.end(), b.begin(), b.end(),
                    [](const DictionaryEntry& x, const DictionaryEntry& y) {
                      return x.first == y.first.view() && x.second == y.second;
                    });
}

// ---------------------------------------------------------------------------
// The document arena and its builder

namespace detail {

DocumentArena* DocumentArena::create(std::size_t sizeHint) {
  const std::size_t size =
      std::max<std::size_t>(512, sizeHint + sizeHint / 2) + sizeof(Block) + sizeof(DocumentArena);
  char* memory = static_cast<char*>(::operator new(size));
  auto* block = new (memory) Block{nullptr};
  auto* arena = new (memory + sizeof(Block)) DocumentArena();
  arena->blocks_ = block;
  arena->cursor_ = memory + sizeof(Block) + sizeof(DocumentArena);
  arena->cursor_ += (8 - reinterpret_cast<std::uintptr_t>(arena->cursor_) % 8) % 8;
  arena->limit_ = memory + size;
  arena->nextBlockSize_ = size;
  return arena;
}

void DocumentArena::addBlock(std::size_t atLeast) {
  nextBlockSize_ *= 2;
  const std::size_t size = std::max(nextBlockSize_, atLeast + sizeof(Block) + 8);
  char* memory = static_cast<char*>(::operator new(size));
  blocks_ = new (memory) Block{blocks_};
  cursor_ = memory + ((sizeof(Block) + 7) & ~std::size_t{7});
  limit_ = memory + size;
}

void DocumentArena::destroy() noexcept {
  Block* block = blocks_;
  this->~DocumentArena();
  while (block != nullptr) {
    Block* next = block->next;
    ::operator delete(block);
    block = next;
  }
}

DocumentBuilder::DocumentBuilder(std::size_t sizeHint) : arena_(DocumentArena::create(sizeHint)) {}

DocumentBuilder::~DocumentBuilder() {
  if (arena_ == nullptr) return;
  // The root's reference is the builder's own: forget it, free the arena.
  if (root_.kind_ != Value::Kind::String && !root_.isPlain() && root_.node()->arena == arena_) {
    root_.kind_ = Value::Kind::Null;
  }
  arena_->release();
}

Value* DocumentBuilder::makeArray(Value& slot, std::size_t count) {
  auto* node = new (arena_->allocate(sizeof(ArrayNode))) ArrayNode();
  node->arena = arena_;
  Value* elements = nullptr;
  if (count != 0) {
    elements = static_cast<Value*>(arena_->allocate(sizeof(Value) * checkedCount(count)));
  }
  node->array.data_ = elements;
  node->array.size_ = node->array.capacity_ = static_cast<std::uint32_t>(count);
  node->array.borrowed_ = true;
  slot.setNode(Value::Kind::Array, node);
  return elements;
}

DictionaryEntry* DocumentBuilder::makeDictionary(Value& slot, std::size_t count) {
  auto* node = new (arena_->allocate(sizeof(DictionaryNode))) DictionaryNode();
  node->arena = arena_;
  DictionaryEntry* entries = nullptr;
  if (count != 0) {
    entries = static_cast<DictionaryEntry*>(
        arena_->allocate(sizeof(DictionaryEntry) * checkedCount(count)));
  }
  node->dictionary.data_ = entries;
  node->dictionary.size_ = node->dictionary.capacity_ = static_cast<std::uint32_t>(count);
  node->dictionary.borrowed_ = true;
  slot.setNode(Value::Kind::Dictionary, node);
  return entries;
}

const DocumentBuilder::Shape* DocumentBuilder::findShape(const DictionaryEntry* entries,
                                                         std::size_t count) const {
  for (const Shape& shape : shapes_) {
    if (shape.keys.size() != count) continue;
    std::size_t i = 0;
    while (i < count && entries[i].first == shape.keys[i]) ++i;
    if (i == count) return &shape;
  }
  return nullptr;
}

// Moves entries[order[j]] to position j. Entries in the arena own nothing
// outside it, so they move as bytes.
void DocumentBuilder::arrange(DictionaryEntry* entries, const std::vector<std::uint32_t>& order) {
  const std::size_t bytes = sizeof(DictionaryEntry) * order.size();
  if (scratch_.size() < bytes) scratch_.resize(bytes);
  auto* sorted = reinterpret_cast<DictionaryEntry*>(scratch_.data());
  for (std::size_t j = 0; j < order.size(); ++j) {
    std::memcpy(static_cast<void*>(sorted + j), entries + order[j], sizeof(DictionaryEntry));
  }
  std::memcpy(static_cast<void*>(entries), sorted, bytes);
}

void DocumentBuilder::finishDictionary(Value& slot) {
  Dictionary& d = static_cast<DictionaryNode*>(slot.node())->dictionary;
  DictionaryEntry* entries = d.data_;
  const std::size_t count = d.size_;
  if (count < 2) return;
  if (const Shape* shape = findShape(entries, count)) {
    arrange(entries, shape->order);
    d.size_ = static_cast<std::uint32_t>(shape->order.size());
    return;
  }
  // A new layout: sort (stable, so that of duplicate keys the last stays
  // last) and remember it.
  std::vector<std::string_view> keys(count);  // into the entries: valid until arrange()
  std::vector<std::uint32_t> order(count);
  for (std::size_t i = 0; i < count; ++i) {
    keys[i] = entries[i].first.view();
    order[i] = static_cast<std::uint32_t>(i);
  }
  std::stable_sort(order.begin(), order.end(),
                   [&](std::uint32_t a, std::uint32_t b) { return keys[a] < keys[b]; });
  std::size_t kept = 0;
  for (std::size_t j = 0; j < count; ++j) {
    if (j + 1 < count && keys[order[j]] == keys[order[j + 1]]) continue;
    order[kept++] = order[j];
  }
  order.resize(kept);
  Shape shape;
  if (count <= 64) shape.keys.assign(keys.begin(), keys.end());
  arrange(entries, order);
  d.size_ = static_cast<std::uint32_t>(kept);
  shape.order = std::move(order);
  // Few layouts recur; a document of many distinct ones keeps the last few.
  constexpr std::size_t kShapes = 8;
  if (shape.keys.empty()) return;
  if (shapes_.size() < kShapes) {
    shapes_.push_back(std::move(shape));
  } else {
    shapes_[nextShape_] = std::move(shape);
    nextShape_ = (nextShape_ + 1) % kShapes;
  }
}

String DocumentBuilder::makeString(std::string_view text) {
  if (text.size() <= String::kInlineCapacity) return String(text);
  char* chars = static_cast<char*>(arena_->allocate(text.size()));
  std::memcpy(chars, text.data(), text.size());
  String s;
  s.setOutOfLine(chars, text.size(), String::kBorrowed);
  return s;
}

void DocumentBuilder::setString(Value& slot, std::string_view text) {
  new (&slot) Value(makeString(text));
}

void DocumentBuilder::setKey(String& key, std::string_view text) {
  new (&key) String(makeString(text));
}

Value DocumentBuilder::finish() {
  Value result = std::move(root_);
  const bool inArena =
      result.kind_ != Value::Kind::String && !result.isPlain() && result.node()->arena == arena_;
  if (!inArena) {
    // No container: the arena holds at most the root's text.
    if (const String* s = result.asString()) result = Value(String(s->view()));
    arena_->release();
  }
  arena_ = nullptr;
  return result;
}

}  // namespace detail
}  // namespace kivi
