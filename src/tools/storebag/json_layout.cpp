// SPDX-License-Identifier: Apache-2.0
// Reads tokens into a tree that has the comments, sorts it and prints it.
#include "storebag/json_layout.h"

#include <algorithm>
#include <vector>

#include "config/storebag_content.h"
#include "formats/json_tokens.h"

namespace veltrad::storebag {
namespace {

using config::Key;
using config::KeyTable;
using formats::JSONToken;
using Kind = JSONToken::Kind;

constexpr std::size_t kWidth = 100;
constexpr std::size_t kIndent = 2;

struct Comment {
  std::string_view text;
  // There is an empty line above it.
  bool blankAbove;
};
using Comments = std::vector<Comment>;

struct Item;

struct Node {
  // The text of a scalar.
  std::string_view text;
  char open = '\0', close = '\0';  // of a container
  std::vector<Item> items;
  // Behind the opening bracket, and above the closing one.
  Comments opening, tail;
  // It stands on one line without comments.
  bool oneLine = false;
};

// An entry or an element.
struct Item {
  Comments above, behind;
  bool blankAbove = false;
  std::string_view key;  // with its quotes; empty in an array
  Node value;
};

class Reader {
 public:
  explicit Reader(std::string_view text) : _text(text), _tokens(text) { advance(); }

  // The outermost value, as the only item.
  Item read() {
    Item top;
    top.above = comments();
    top.blankAbove = _newlines >= 2;
    top.value = value();
    top.behind = comments();
    return top;
  }

 private:
  void advance() {
    const std::size_t end = _now.offset + _now.text.size();
    _now = _tokens.next();
    const std::string_view between = _text.substr(end, _now.offset - end);
    _newlines = std::count(between.begin(), between.end(), '\n');
  }

  Comments comments() {
    Comments found;
    for (; _now.kind == Kind::comment; advance()) found.push_back({_now.text, _newlines >= 2});
    return found;
  }

  bool endsItsLine() const {
    const std::size_t next = _text.find_first_not_of(" \t\r", _now.offset + _now.text.size());
    return next == std::string_view::npos || _text[next] == '\n';
  }
  void takeBehind(Comments& behind) {
    for (; _now.kind == Kind::comment && _newlines == 0 && endsItsLine(); advance())
      behind.push_back({_now.text, false});
  }

  Node value() {
    Node node;
    if (_now.kind != Kind::openObject && _now.kind != Kind::openArray) {
      node.text = _now.text;
      advance();
      return node;
    }
    const bool isObject = _now.kind == Kind::openObject;
    const std::size_t start = _now.offset;
    node.open = isObject ? '{' : '[';
    node.close = isObject ? '}' : ']';
    advance();
    takeBehind(node.opening);
    readItems(node, isObject);
    const std::string_view whole = _text.substr(start, _now.offset - start);
    node.oneLine = whole.find('\n') == std::string_view::npos && !hasComments(node);
    advance();
    return node;
  }

  void readItems(Node& node, bool isObject) {
    Comments pending;  // read before it was known what follows
    for (;;) {
      Item item;
      item.above = std::move(pending);
      pending.clear();
      append(item.above, comments());
      item.blankAbove = _newlines >= 2;
      if (_now.kind == Kind::closeObject || _now.kind == Kind::closeArray || _now.kind == Kind::end) {
        node.tail = std::move(item.above);
        return;
      }
      if (isObject) {
        item.key = _now.text;
        advance();
        append(item.above, comments());
        advance();  // the colon
        append(item.above, comments());
      }
      item.value = value();
      takeBehind(item.behind);
      pending = comments();
      if (_now.kind == Kind::comma) {
        advance();
        if (pending.empty()) takeBehind(item.behind);
      }
      node.items.push_back(std::move(item));
    }
  }

  static void append(Comments& to, const Comments& more) { to.insert(to.end(), more.begin(), more.end()); }
  static bool hasComments(const Node& node) {
    return !node.opening.empty() || !node.tail.empty() ||
           std::any_of(node.items.begin(), node.items.end(), [](const Item& item) {
             return !item.above.empty() || !item.behind.empty() || hasComments(item.value);
           });
  }

  const std::string_view _text;
  formats::JSONTokens _tokens;
  JSONToken _now{Kind::end, 0, {}};
  // Between the token before and this one.
  std::ptrdiff_t _newlines = 0;
};

// `table`: of the keys in this node, or in its elements; null: they have no order.
void sortKeys(Node& node, const KeyTable* table) {
  const auto keyOf = [table](const Item& item) {
    return table && !item.key.empty() ? table->find(formats::textOfToken(item.key)) : nullptr;
  };
  const auto rank = [&](const Item& item) {
    const Key* key = keyOf(item);
    return key ? static_cast<std::size_t>(key - table->data()) : table->size();
  };
  if (table && node.open == '{')
    std::stable_sort(node.items.begin(), node.items.end(),
                     [&](const Item& a, const Item& b) { return rank(a) < rank(b); });
  for (Item& item : node.items) {
    const Key* key = keyOf(item);
    sortKeys(item.value, node.open == '[' ? table : key ? key->inner : nullptr);
  }
}

class Printer {
 public:
  std::string print(const Item& top) {
    lines(top.above, 0, true);
    if (top.blankAbove && !top.above.empty()) _out += '\n';
    node(top.value, 0);
    _out += '\n';
    lines(top.behind, 0, false);
    return std::move(_out);
  }

 private:
  void lines(const Comments& comments, std::size_t depth, bool first) {
    for (const Comment& comment : comments) {
      if (comment.blankAbove && !first) _out += '\n';
      first = false;
      indent(depth);
      _out += comment.text;
      _out += '\n';
    }
  }

  void indent(std::size_t depth) { _out.append(depth * kIndent, ' '); }
  void behind(const Comments& comments) {
    for (const Comment& comment : comments) (_out += ' ') += comment.text;
  }

  void node(const Node& node, std::size_t depth) {
    if (node.open == '\0') {
      _out += node.text;
      return;
    }
    if (node.items.empty() && node.opening.empty() && node.tail.empty()) {
      (_out += node.open) += node.close;
      return;
    }
    if (node.oneLine) {
      const std::size_t column = _out.size() - (_out.rfind('\n') + 1);
      const std::string text = onOneLine(node);
      if (column + text.size() < kWidth) {
        _out += text;
        return;
      }
    }
    _out += node.open;
    behind(node.opening);
    _out += '\n';
    for (const Item& item : node.items)
      itemLines(item, depth + 1, &item == &node.items.front(), &item == &node.items.back());
    lines(node.tail, depth + 1, node.items.empty());
    indent(depth);
    _out += node.close;
  }

  void itemLines(const Item& item, std::size_t depth, bool first, bool last) {
    lines(item.above, depth, first);
    if (item.blankAbove && (!first || !item.above.empty())) _out += '\n';
    indent(depth);
    if (!item.key.empty()) (_out += item.key) += ": ";
    node(item.value, depth);
    if (!last) _out += ',';
    behind(item.behind);
    _out += '\n';
  }

  static std::string onOneLine(const Node& node) {
    if (node.open == '\0') return std::string(node.text);
    std::string text(1, node.open);
    for (const Item& item : node.items) {
      if (text.size() > 1) text += ", ";
      if (!item.key.empty()) (text += item.key) += ": ";
      text += onOneLine(item.value);
    }
    return text + node.close;
  }

  std::string _out;
};

}  // namespace

std::string laidOut(std::string_view text) {
  Item top = Reader(text).read();
  sortKeys(top.value, &config::Storebag::kKeys);
  return Printer().print(top);
}

}  // namespace veltrad::storebag
