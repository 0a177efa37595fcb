// DocumentBuilder: builds a Value tree in one arena, for readers of whole
// documents (the JSON reader). Not for hosts.
//
// Every array, dictionary and long string of the document is carved from the
// arena; the finished root holds the arena, copies of any part of the tree
// share it, and the whole tree goes at once when the last of them does. A
// container is made with its final size and filled in place:
//
//   detail::DocumentBuilder builder(text.size());
//   Value& root = builder.root();
//   DictionaryEntry* members = builder.makeDictionary(root, 2);
//   builder.setKey(members[0].first, "b");
//   builder.setNumber(members[0].second, Number(1.5));
//   builder.setKey(members[1].first, "a");
//   builder.setString(members[1].second, "text");
//   builder.finishDictionary(root);  // sorted by key; the last duplicate wins
//   Value document = builder.finish();
//
// Every slot must be set once, through the builder, before finish().
// Dropping the builder without finish() frees what it made.
//
// Thread contract: one thread builds; the finished Value is an ordinary one.
#pragma once

#include <cstddef>
#include <cstdint>
#include <new>
#include <string>
#include <string_view>
#include <vector>

#include "kivi/base/value.h"

namespace kivi::detail {

class DocumentArena;

class DocumentBuilder {
 public:
  // `sizeHint`: the size of the source text, from which the first block is
  // sized.
  explicit DocumentBuilder(std::size_t sizeHint);
  ~DocumentBuilder();
  DocumentBuilder(const DocumentBuilder&) = delete;
  DocumentBuilder& operator=(const DocumentBuilder&) = delete;

  // The slot for the document's root, null until set.
  Value& root() noexcept { return root_; }

  // Makes `slot` an array of `count` elements and returns them; each must be
  // set once, with a set…() or make…() call.
  Value* makeArray(Value& slot, std::size_t count);
  // Makes `slot` a dictionary of `count` members and returns them; each key
  // and value must be set once, then finishDictionary(slot).
  DictionaryEntry* makeDictionary(Value& slot, std::size_t count);
  // Sorts the members by key; of duplicate keys the last one stays.
  void finishDictionary(Value& slot);
  // Sets a slot that has not been set yet.
  void setString(Value& slot, std::string_view text);
  void setKey(String& key, std::string_view text);
  static void setNumber(Value& slot, Number n) noexcept { new (&slot) Value(n); }
  static void setNull(Value& slot) noexcept { new (&slot) Value(); }

  // The finished document; the builder is spent.
  Value finish();

 private:
  // A dictionary layout seen before: the keys in the order they came and
  // where each member goes. Records in an array mostly share one.
  struct Shape {
    std::vector<std::string> keys;
    std::vector<std::uint32_t> order;  // original index of each sorted member
  };
  const Shape* findShape(const DictionaryEntry* entries, std::size_t count) const;
  void arrange(DictionaryEntry* entries, const std::vector<std::uint32_t>& order);

  String makeString(std::string_view text);

  DocumentArena* arena_;
  Value root_;
  std::vector<Shape> shapes_;
  std::size_t nextShape_ = 0;
  std::vector<unsigned char> scratch_;
};

}  // namespace kivi::detail
