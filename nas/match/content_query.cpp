#include "nas/match/content_query.h"

#include <utf8proc.h>

#include <algorithm>
#include <cstdlib>

namespace nas {
namespace {

std::string Decompose(const std::string& text) {
  const std::unique_ptr<utf8proc_uint8_t, void (*)(void*)> form(
      utf8proc_NFD(reinterpret_cast<const utf8proc_uint8_t*>(text.c_str())), std::free);
  return form ? std::string(reinterpret_cast<const char*>(form.get())) : text;
}

using Kind = QueryNode::Kind;

bool IsContentText(const QueryNode& leaf) {
  return leaf.kind == Kind::kText && !leaf.text->exact() &&
         (leaf.text->is_literal() || leaf.text->is_regex());
}

// Whether `node` may match a file in which no text is found; criteria count as not met.
bool HoldsWithoutTexts(const QueryNode& node, bool negated) {
  const auto holds = [&](const QueryNode& child) { return HoldsWithoutTexts(child, negated); };
  switch (node.kind) {
    case Kind::kNot:
      return HoldsWithoutTexts(node.children.front(), !negated);
    case Kind::kAll:
    case Kind::kAny:
      return (node.kind == Kind::kAll) != negated ? std::ranges::all_of(node.children, holds)
                                                  : std::ranges::any_of(node.children, holds);
    case Kind::kText:
      return negated;
    default:
      return false;
  }
}

bool HasPositiveText(const QueryNode& node, bool negated) {
  if (node.kind == Kind::kText) return !negated;
  return std::ranges::any_of(node.children, [&](const QueryNode& child) {
    return HasPositiveText(child, negated != (node.kind == Kind::kNot));
  });
}

bool TextsAskForContents(const QueryNode& root) {
  const auto unfit = [](const QueryNode& leaf) {
    return leaf.kind == Kind::kText && !IsContentText(leaf);
  };
  return HasPositiveText(root, false) && !HoldsWithoutTexts(root, false) && !AnyLeaf(root, unfit);
}

}  // namespace

std::optional<ContentQuery::Needle> ContentQuery::MakeNeedle(const TextTerm& text) {
  Needle needle;
  if (!text.is_regex() && IsAscii(text.text())) {
    needle.literal.emplace(text.text());
    return needle;
  }
  // A text may be stored composed or decomposed, so both forms of a literal are looked for.
  const std::string composed = ComposeText(text.text());
  const auto kind = text.is_regex() ? Regex::Kind::kContent : Regex::Kind::kLiteral;
  for (const std::string& form : {composed, Decompose(composed)}) {
    if (form == composed && !needle.expressions.empty()) continue;
    auto expression = Regex::Compile(form, kind);
    if (!expression) return std::nullopt;
    needle.expressions.push_back(std::move(*expression));
  }
  return needle;
}

// False where a text cannot be looked for.
bool ContentQuery::AddNeedles(QueryNode& node, bool negated) {
  for (QueryNode& child : node.children) {
    if (!AddNeedles(child, negated != (node.kind == Kind::kNot))) return false;
  }
  if (node.kind != Kind::kContent && !(texts_too_ && node.kind == Kind::kText)) return true;
  std::optional<Needle> needle = MakeNeedle(*node.text);
  if (!needle) return false;
  needle->negated = negated;
  by_lines_ |= node.text->is_regex();
  beyond_ascii_ |= !needle->literal;
  // A decomposed form is at most three times as long as the composed one.
  overlap_ = std::max(overlap_, node.text->text().size() * (needle->literal ? 1 : 3));
  node.needle = static_cast<int>(needles_.size());
  needles_.push_back(std::move(*needle));
  return true;
}

std::optional<ContentQuery> ContentQuery::From(const QueryNode& query, bool texts_too) {
  for (const bool texts : {true, false}) {
    if (texts && !(texts_too && TextsAskForContents(query))) continue;
    ContentQuery made;
    made.root_ = query;
    made.texts_too_ = texts;
    if (made.AddNeedles(made.root_, false) && !made.needles_.empty()) return made;
  }
  return std::nullopt;
}

std::vector<ContentQuery> ContentQuery::ForLines(const QueryNode& query) {
  std::vector<ContentQuery> made;
  for (const bool texts_too : {true, false}) {
    if (!made.empty() && !made.back().texts_too()) break;
    if (auto one = From(query, texts_too)) made.push_back(std::move(*one));
  }
  return made;
}

std::optional<TextPlace> ContentQuery::Needle::Find(std::string_view text, size_t from) const {
  if (literal) {
    auto place = literal->Find(text.substr(from));
    if (place) place->at += from;
    return place;
  }
  std::optional<TextPlace> first;
  for (const auto& expression : expressions) {
    const auto place = expression->Find(text, from);
    if (place && (!first || place->at < first->at)) first = place;
  }
  return first;
}

Answer ContentQuery::AskTexts(const std::vector<bool>& found, bool all_read) const {
  QuerySubject subject;
  subject.is_file = true;
  subject.texts_in_contents = texts_too_;
  subject.found = &found;
  subject.all_read = all_read;
  const Answer answer = Ask(root_, subject);
  return all_read && answer == Answer::kMaybe ? Answer::kYes : answer;
}

}  // namespace nas
