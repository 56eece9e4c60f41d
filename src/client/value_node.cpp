// SPDX-License-Identifier: Apache-2.0
// Nodes, and their conversion from and to veltrad::Value.
#include "client/value_node.h"

#include <limits>

namespace {

std::size_t plus(std::size_t a, std::size_t b) {
  return a > std::numeric_limits<std::size_t>::max() - b ? std::numeric_limits<std::size_t>::max() : a + b;
}

}  // namespace

veltra_value* veltra_retain(const veltra_value* value) {
  auto* shared = const_cast<veltra_value*>(value);
  if (shared) shared->references.fetch_add(1, std::memory_order_relaxed);
  return shared;
}

void veltra_release(const veltra_value* value) {
  auto* shared = const_cast<veltra_value*>(value);
  if (shared && shared->references.fetch_sub(1, std::memory_order_acq_rel) == 1) delete shared;
}

veltra_value::~veltra_value() {
  if (const Items* all = items()) {
    for (const veltra_value* item : *all) veltra_release(item);
  } else if (const Entries* all = entries()) {
    for (const auto& entry : *all) veltra_release(entry.second);
  }
  delete madeIndex.load(std::memory_order_relaxed);
}

const veltra_value::Index& veltra_value::index() const {
  if (const Index* made = madeIndex.load(std::memory_order_acquire)) return *made;
  auto* fresh = new Index;
  fresh->reserve(entries()->size());
  for (const auto& entry : *entries()) fresh->push_back(&entry);
  const Index* expected = nullptr;
  if (madeIndex.compare_exchange_strong(expected, fresh, std::memory_order_acq_rel)) return *fresh;
  delete fresh;  // another thread was faster
  return *expected;
}

bool veltra_value::admit(veltra_value* part) {
  if (isPart.load(std::memory_order_relaxed) || part == this || part->depth >= veltrad::client::kDeepestValue)
    return false;
  part->isPart.store(true, std::memory_order_relaxed);
  if (part->depth + 1 > depth) depth = part->depth + 1;
  objects = plus(objects, part->objects);
  return true;
}

bool veltra_value::append(veltra_value* part) {
  auto* all = std::get_if<Items>(&held);
  if (!all || !admit(part)) return false;
  all->push_back(part);
  return true;
}

bool veltra_value::set(std::string key, veltra_value* part) {
  auto* all = std::get_if<Entries>(&held);
  if (!all || !admit(part)) return false;
  delete madeIndex.exchange(nullptr, std::memory_order_relaxed);
  const auto [at, added] = all->try_emplace(std::move(key), part);
  if (!added) {
    if (objects != std::numeric_limits<std::size_t>::max()) objects -= at->second->objects;
    veltra_release(std::exchange(at->second, part));
  }
  return true;
}

namespace veltrad::client {

ValuePointer nodeOfDictionary(const Dictionary& dictionary) {
  ValuePointer node(new veltra_value(veltra_value::Entries{}));
  for (const auto& [key, value] : dictionary) {
    ValuePointer part = nodeOfValue(value);
    if (node->set(key, part.get())) (void)part.release();
  }
  return node;
}

ValuePointer nodeOfValue(const Value& value) {
  if (const Dictionary* dictionary = value.asDictionary()) return nodeOfDictionary(*dictionary);
  const Array* array = value.asArray();
  if (!array) return ValuePointer(new veltra_value(value));
  ValuePointer node(new veltra_value(veltra_value::Items{}));
  for (const Value& item : *array) {
    ValuePointer part = nodeOfValue(item);
    if (node->append(part.get())) (void)part.release();
  }
  return node;
}

Dictionary dictionaryOfNode(const veltra_value* node) {
  if (!node || !node->entries()) return {};
  std::vector<Dictionary::Entry> entries;
  entries.reserve(node->entries()->size());
  for (const auto& [key, part] : *node->entries()) entries.emplace_back(key, valueOfNode(*part));
  return Dictionary::fromEntries(std::move(entries));
}

Value valueOfNode(const veltra_value& node) {
  if (const Value* leaf = node.leaf()) return *leaf;
  if (node.entries()) return dictionaryOfNode(&node);
  Array array;
  array.reserve(node.items()->size());
  for (const veltra_value* item : *node.items()) array.push_back(valueOfNode(*item));
  return array;
}

}  // namespace veltrad::client
