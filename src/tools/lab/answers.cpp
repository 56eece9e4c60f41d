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

Result<std::string, std::string> bodyFor(const StorebagFile& file, const Directory& directory,
                                         const std::optional<Rule>& rule) {
  const auto sign = rule ? rule->sign : Rule::Signature::right;
  if (!file.container.empty()) return file.container;
  if (sign == Rule::Signature::right)
    return stampedContainer(file.storebag, rule ? rule->bag.value_or(Stamp()) : Stamp(), directory);
  std::string bag = formats::writeXMLPropertyList(file.storebag);
  if (sign == Rule::Signature::none) return bag;
  Dictionary container{{"bag", encodeBase64(bag)}};
  if (sign == Rule::Signature::wrong) {
    const auto key = directory.signingKey(kOwnKeys);
    if (!key) return Failure{key.error()};
    std::string signature = key.value().sign(bag);
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

Answer answerWithStorebag(const StorebagFile& file, const Directory& directory,
                          const std::optional<Rule>& rule, int maxAge, const std::string& ifModifiedSince) {
  Answer answer;
  answer.type = "application/x-plist";
  answer.headers.set("Last-Modified", httpDate(file.modified));
  answer.headers.set("Cache-Control", "max-age=" + std::to_string(maxAge));
  const auto since = fromHTTPDate(ifModifiedSince);
  if (since && file.modified <= *since && !(rule && rule->bag)) {
    answer.status = 304;
    return answer;
  }
  auto body = bodyFor(file, directory, rule);
  if (!body) return answerWithFailure({StorebagFailure::Kind::unreadable, body.error()});
  answer.body = std::move(body).value();
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
