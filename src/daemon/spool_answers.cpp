// SPDX-License-Identifier: Apache-2.0
// Reads the spool's state, and its files for details that only they hold.
#include "daemon/spool_answers.h"

#include <algorithm>
#include <chrono>
#include <cstdint>
#include <vector>

#include "backends/https/post_spool.h"
#include "base/null_value.h"
#include "base/text.h"

namespace veltrad::daemon {

namespace {

using backends::PostSpool;
using backends::SpoolQueue;

// So that an answer fits into a frame.
constexpr std::size_t kMostPosts = 500;
constexpr std::size_t kMostAddresses = 256;
constexpr std::size_t kMostListedBytes = 384u << 10;
constexpr std::chrono::seconds kLoadPatience{20};

std::string noSpool() {
  return "There is no spool: \"spool\" in etc/veltrad/settings.json, as read at start, makes one.";
}

double secondsOfOrder(std::uint64_t order) {
  return static_cast<double>(order) / 1e6;
}

Value knownOrNull(double time) {
  return time > 0 ? time : nullValue();
}

Value knownOrNull(const std::string& text) {
  return text.empty() ? nullValue() : text;
}

Dictionary lineOfPost(const support::SpoolEntry& entry, const support::SpoolPlace& place,
                      const SpoolQueue::AddressStatus& address) {
  Dictionary line{{"id", support::textOf(entry.id)},
                  {"time", secondsOfOrder(entry.order)},
                  {"url", entry.url},
                  {"bytes", place.bytes},
                  {"events", entry.events},
                  {"uid", entry.uid},
                  {"tries", unsigned{place.tries}},
                  // The file knows of those before it was written.
                  {"lastError", knownOrNull(place.tries > entry.tries ? address.lastError : entry.lastError)},
                  {"nextTry", knownOrNull(address.nextTry)}};
  for (const char* key : {"clientType", "sessionID", "client", "service"})
    line.set(key, orNull(entry.client.find(key)));
  for (const char* key : {"backend", "storebag", "entry"}) line.set(key, orNull(entry.about.find(key)));
  return line;
}

}  // namespace

Value statusOfSpool(PostSpool* spool) {
  if (!spool) return nullValue();
  const auto amount = spool->queue().amount();
  Array addresses;
  for (const SpoolQueue::AddressStatus& one : spool->queue().addresses()) {
    if (addresses.size() == kMostAddresses) break;
    addresses.push_back(Dictionary{{"address", one.address},
                                   {"posts", one.amount.posts},
                                   {"bytes", one.amount.bytes},
                                   {"oldest", knownOrNull(secondsOfOrder(one.amount.oldest))},
                                   {"nextTry", knownOrNull(one.nextTry)},
                                   {"lastError", knownOrNull(one.lastError)}});
  }
  return Dictionary{{"posts", amount.posts},
                    {"bytes", amount.bytes},
                    {"oldest", knownOrNull(secondsOfOrder(amount.oldest))},
                    {"addresses", std::move(addresses)}};
}

Result<Dictionary, std::string> spoolPage(PostSpool* spool, const Dictionary& arguments) {
  if (!spool) return Failure{noSpool()};
  if (!spool->queue().waitUntilLoaded(std::chrono::steady_clock::now() + kLoadPatience))
    return Failure{std::string("The spool is still being read.")};
  const Value* from = arguments.find("after");
  auto after = static_cast<std::uint64_t>(from ? from->toInt64().value_or(0) : 0);
  Array posts;
  std::size_t bytes = 0;
  const auto names = spool->queue().names(after, kMostPosts);
  for (const PostSpool::Name& name : names) {
    if (bytes > kMostListedBytes) break;
    after = name.order;
    const auto entry = spool->read(name).entry;
    const auto place = spool->queue().place(name.order);
    if (!entry || !place) continue;  // it has left
    posts.push_back(lineOfPost(*entry, *place, spool->queue().statusAt(place->address)));
    bytes += keptBytes(posts.back());
  }
  Dictionary page{{"posts", std::move(posts)}};
  if (!names.empty()) page.set("next", after);
  return page;
}

Result<Dictionary, std::string> sendSpool(PostSpool* spool) {
  if (!spool) return Failure{noSpool()};
  return Dictionary{{"posts", spool->sendNow()}};
}

Result<Dictionary, std::string> dropFromSpool(PostSpool* spool, const Dictionary& arguments) {
  if (!spool) return Failure{noSpool()};
  const Array* ids = arguments.array("ids");
  std::vector<PostSpool::Name> names;
  for (const Value& one : ids ? *ids : Array()) {
    const auto id = one.asString() ? support::postIDOf(*one.asString()) : std::nullopt;
    const auto name = id ? spool->queue().named(*id) : std::nullopt;
    if (!name)
      return Failure{"There is no post \"" + escapedForLog(one.toText().value_or("")) +
                     "\" in the spool: see veltractl spool."};
    const auto same = [&](const PostSpool::Name& other) { return other.order == name->order; };
    if (std::none_of(names.begin(), names.end(), same)) names.push_back(*name);
  }
  if (names.empty()) return Failure{std::string("argument \"ids\" must name posts")};
  for (const PostSpool::Name& name : names) spool->drop(name, wire::Reason::by_hand);
  return Dictionary{{"posts", names.size()}};
}

}  // namespace veltrad::daemon
