// SPDX-License-Identifier: Apache-2.0
// Follows texts, sessions, batches and posts from entry to entry.
#include "support/fate_reader.h"

#include <algorithm>

namespace veltrad::support {

using wire::EntryKind;
using wire::Step;

void FateReader::read(std::uint64_t position, const wire::FateWords& words) {
  _position = position;
  switch (wire::kindOf(words)) {
    case EntryKind::text:
      return readText(wire::entryOf<wire::TextEntry>(words));
    case EntryKind::moreText:
      return readMoreText(wire::entryOf<wire::MoreTextEntry>(words));
    case EntryKind::session:
      return readSession(wire::entryOf<wire::SessionEntry>(words));
    case EntryKind::message: {
      const auto entry = wire::entryOf<wire::MessageEntry>(words);
      const auto* session = find(_sessions, entry.session);
      return _listener.taken({position, entry, session ? *session : nullptr, textAt(entry.aggregatedTo)});
    }
    case EntryKind::standing:
      _standings.emplace(position, wire::entryOf<wire::StandingEntry>(words));
      return forgetOld();
    case EntryKind::step:
      return readStep(wire::entryOf<wire::StepEntry>(words));
    case EntryKind::names:
      return readNames(wire::entryOf<wire::NamesEntry>(words));
    case EntryKind::none:
      return;
  }
}

// The nearest position before this one that ends so.
template <typename Kept>
const Kept* FateReader::find(const std::map<std::uint64_t, Kept>& kept, wire::FateRef reference) const {
  if (reference == 0) return nullptr;
  const std::uint64_t back = static_cast<wire::FateRef>(_position) - reference;
  const auto found = kept.find(_position - (back & 0xFFFF'FFFFu));
  return found == kept.end() ? nullptr : &found->second;
}

std::optional<std::string> FateReader::textAt(wire::FateRef reference) const {
  const std::string* text = find(_texts, reference);
  return text ? std::optional(*text) : std::nullopt;
}

void FateReader::readText(const wire::TextEntry& entry) {
  const std::size_t first = std::min<std::size_t>(entry.length, sizeof entry.bytes);
  _open = {_position, _position + 1, entry.length, std::string(entry.bytes, first)};
  takeText();
}

void FateReader::readMoreText(const wire::MoreTextEntry& entry) {
  if (_position != _open.next) return;
  ++_open.next;
  _open.text.append(entry.bytes, std::min(_open.length - _open.text.size(), sizeof entry.bytes));
  takeText();
}

void FateReader::takeText() {
  if (_open.text.size() < _open.length) return;
  _texts.insert_or_assign(_open.position, std::move(_open.text));
  _open = {};
  forgetOld();
}

void FateReader::readSession(const wire::SessionEntry& entry) {
  auto told = std::make_shared<ToldSession>();
  told->entry = entry;
  const std::pair<wire::FateRef, std::optional<std::string>*> texts[] = {
      {entry.session, &told->session},   {entry.client, &told->client},   {entry.service, &told->service},
      {entry.storebag, &told->storebag}, {entry.version, &told->version}, {entry.section, &told->section}};
  bool whole = true;
  for (const auto& [reference, text] : texts) {
    *text = textAt(reference);
    whole = whole && (reference == 0 || text->has_value());
  }
  for (std::size_t i = 0; i < wire::SessionEntry::kNotMade && entry.notMade[i] != 0; ++i) {
    auto name = textAt(entry.notMade[i]);
    whole = whole && name;
    if (name) told->notMade.emplace_back(*name, static_cast<wire::Reason>(entry.notMadeReasons[i]));
  }
  if (whole) _sessions.emplace(_position, std::move(told));
  forgetOld();
}

// The messages of a batch move to its post, and are forgotten when the post has ended.
std::vector<std::uint64_t> FateReader::messagesOf(const wire::StepEntry& entry) {
  if (entry.message != 0) {
    if (entry.step == Step::dropped) {
      const auto batch = _batches.find(entry.batch);
      if (batch != _batches.end() && std::erase(batch->second, entry.message) > 0 && batch->second.empty())
        _batches.erase(batch);
    } else if (entry.batch != 0) {
      _batches[entry.batch].push_back(entry.message);
    }
    if (entry.step == Step::posted) _posts[entry.post] = {entry.message};
    return {entry.message};
  }
  if (entry.batch != 0) {
    const auto batch = _batches.find(entry.batch);
    if (batch == _batches.end()) return {};
    if (entry.step == Step::flushed) return batch->second;
    std::vector<std::uint64_t> messages = std::move(batch->second);
    _batches.erase(batch);
    if (entry.step == Step::posted) _posts[entry.post] = messages;
    return messages;
  }
  if (entry.step == Step::kept || entry.step == Step::again) {
    const auto found = _posts.find(entry.post);
    return found == _posts.end() ? std::vector<std::uint64_t>() : found->second;
  }
  auto post = _posts.extract(entry.post);
  return post ? std::move(post.mapped()) : std::vector<std::uint64_t>();
}

void FateReader::readStep(const wire::StepEntry& entry) {
  ToldStep step;
  step.entry = entry;
  step.text = textAt(entry.text);
  if (const auto* standing = find(_standings, entry.standing)) step.standing = *standing;
  for (const std::uint64_t message : messagesOf(entry)) {
    step.message = message;
    _listener.stepped(step);
  }
}

void FateReader::readNames(const wire::NamesEntry& entry) {
  ToldStep step;
  step.entry.step = entry.step;
  step.entry.backend = entry.backend;
  step.entry.time = entry.time;
  step.entry.batch = entry.batch;
  for (std::size_t i = 0; i < std::min<std::size_t>(entry.count, wire::NamesEntry::kMost); ++i) {
    if (auto name = textAt(entry.names[i])) step.names.push_back(std::move(*name));
  }
  const auto batch = _batches.find(entry.batch);
  std::vector<std::uint64_t> messages{entry.message};
  if (entry.message == 0) messages = batch == _batches.end() ? std::vector<std::uint64_t>() : batch->second;
  for (const std::uint64_t message : messages) {
    step.message = message;
    _listener.stepped(step);
  }
}

void FateReader::forgetOld() {
  const auto forget = [oldest = _position > _keep ? _position - _keep : 0](auto& kept) {
    while (!kept.empty() && kept.begin()->first < oldest) kept.erase(kept.begin());
  };
  forget(_texts);
  forget(_sessions);
  forget(_standings);
}

}  // namespace veltrad::support
