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

}  // namespace

std::optional<ContentQuery::Needle> ContentQuery::MakeNeedle(
    const NamePattern::Alternative& alternative) {
  Needle needle;
  needle.negated = alternative.negated;
  if (alternative.is_literal() && IsAscii(alternative.text)) {
    needle.literal.emplace(alternative.text);
    return needle;
  }
  // A text may be stored composed or decomposed, so both forms of a literal are looked for.
  const std::string composed = ComposeText(alternative.text);
  const auto kind = alternative.is_literal() ? Regex::Kind::kLiteral : Regex::Kind::kContent;
  for (const std::string& form : {composed, Decompose(composed)}) {
    if (form == composed && !needle.expressions.empty()) continue;
    auto expression = Regex::Compile(form, kind);
    if (!expression) return std::nullopt;
    needle.expressions.push_back(std::move(*expression));
  }
  return needle;
}

std::optional<ContentQuery> ContentQuery::From(const NamePattern& pattern) {
  ContentQuery query;
  bool asks_for_something = false;
  for (const NamePattern::Term& term : pattern.terms()) {
    auto& indexes = query.terms_.emplace_back();
    for (const NamePattern::Alternative& alternative : term) {
      if (alternative.glob) return std::nullopt;
      std::optional<Needle> needle = MakeNeedle(alternative);
      if (!needle) return std::nullopt;
      query.has_negated_ |= needle->negated;
      query.by_lines_ |= alternative.regex != nullptr;
      query.beyond_ascii_ |= !needle->literal;
      // A decomposed form is at most three times as long as the composed one.
      query.overlap_ =
          std::max(query.overlap_, alternative.text.size() * (needle->literal ? 1 : 3));
      indexes.push_back(query.needles_.size());
      query.needles_.push_back(std::move(*needle));
    }
    asks_for_something |=
        std::ranges::none_of(term, [](const NamePattern::Alternative& a) { return a.negated; });
  }
  if (!asks_for_something) return std::nullopt;
  return query;
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

}  // namespace nas
