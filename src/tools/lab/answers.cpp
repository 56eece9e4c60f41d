// SPDX-License-Identifier: Apache-2.0
// Makes the lab's answers and applies rules to them.
#include "answers.h"

#include <ctime>

#include "base/base64.h"
#include "formats/property_list.h"

namespace veltrad::lab {
namespace {

constexpr const char* kDateFormat = "%a, %d %b %Y %H:%M:%S GMT";

std::optional<std::int64_t> fromHTTPDate(const std::string& text) {
  std::tm parts{};
  const char* end = ::strptime(text.c_str(), kDateFormat, &parts);
  if (!end || *end != '\0') return std::nullopt;
  return ::timegm(&parts);
}

std::string bodyFor(const Dictionary& storebag, const config::SigningKey& key, Rule::Signature sign) {
  if (sign == Rule::Signature::right) return config::makeStorebagContainer(key, storebag);
  std::string bag = formats::writeXMLPropertyList(storebag);
  if (sign == Rule::Signature::none) return bag;
  Dictionary container{{"bag", encodeBase64(bag)}};
  if (sign == Rule::Signature::wrong) {
    std::string signature = key.sign(bag);
    signature.back() = static_cast<char>(signature.back() ^ 1);
    container.set("signature", encodeBase64(signature));
  }
  return formats::writeXMLPropertyList(container);
}

}  // namespace

std::string httpDate(std::int64_t secondsSince1970) {
  const std::time_t time = secondsSince1970;
  std::tm parts{};
  char text[64];
  ::gmtime_r(&time, &parts);
  return std::string(text, std::strftime(text, sizeof text, kDateFormat, &parts));
}

Answer answerWithStorebag(const StorebagFile& file, const config::SigningKey& key, Rule::Signature sign,
                          int maxAge, const std::string& ifModifiedSince) {
  Answer answer;
  answer.type = "application/x-plist";
  answer.headers.set("Last-Modified", httpDate(file.modified));
  answer.headers.set("Cache-Control", "max-age=" + std::to_string(maxAge));
  const auto since = fromHTTPDate(ifModifiedSince);
  if (since && file.modified <= *since)
    answer.status = 304;
  else
    answer.body = bodyFor(file.storebag, key, sign);
  return answer;
}

Answer answerWithFailure(const StorebagFailure& failure) {
  Answer answer;
  answer.status = failure.kind == StorebagFailure::Kind::notFound ? 404 : 500;
  answer.type = "text/plain; charset=utf-8";
  answer.body = failure.description + "\n";
  return answer;
}

void applyRule(const Rule& rule, Answer& answer) {
  if (rule.status) answer.status = *rule.status;
  if (rule.body) answer.body = *rule.body;
  if (!rule.lastModified) answer.headers.erase("Last-Modified");
  answer.headers.merge(rule.headers);
}

}  // namespace veltrad::lab
