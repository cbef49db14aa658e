#include "nas/match/text_term.h"

#include <algorithm>
#include <cerrno>
#include <iterator>

#include "nas/match/regex_literal.h"

namespace nas {

Result<std::shared_ptr<const TextTerm>> TextTerm::Make(std::string_view text, Form form,
                                                       bool exact) {
  std::shared_ptr<TextTerm> term(new TextTerm);
  term->exact_ = exact;
  term->text_ = text;
  term->given_ = text;
  term->form_ = form;
  if (form == Form::kRegex) {
    // Names are compared composed, so the expression has to be.
    auto regex = Regex::Compile(ComposeText(text), Regex::Kind::kName, exact);
    if (!regex) return regex.error();
    term->regex_ = std::move(*regex);
    term->forms_.emplace_back();
    return std::shared_ptr<const TextTerm>(std::move(term));
  }
  const bool whole = form == Form::kWhole;
  const size_t slash = text.find('/');
  if (whole && slash != 0 && slash < text.size() - 1) term->text_.insert(0, 1, '/');
  const bool speaks = form == Form::kPlain && Wildcards::Speak(text);
  const bool wild = whole || (speaks && Wildcards::Remain(text));
  if (speaks && !wild) term->text_ = Wildcards::Unescaped(text);
  term->of_path_ = slash != std::string_view::npos;
  // Who looks for "a{b,c}" in contents means these very bytes.
  term->literal_ = !whole && (!wild || !Glob::HasWildcard(text));
  const std::string folded = FoldText(term->text_);
  term->plain_ = !exact && WithoutAccents(folded) == folded;
  std::vector<std::string> forms = {exact ? ComposeText(term->text_) : folded};
  // Byte by byte, what was typed is what a broken name may hold.
  if (const std::string bytes = exact ? term->text_ : AsciiLower(term->text_);
      bytes != forms.front()) {
    forms.push_back(bytes);
  }
  for (std::string& one : forms) {
    Comparand comparand{std::move(one), std::nullopt};
    if (wild) {
      comparand.wildcards = Wildcards::Make(comparand.text, term->of_path_);
      if (!comparand.wildcards) return Error{kErrorIllegal, EINVAL, "stands for too many names"};
    }
    term->forms_.push_back(std::move(comparand));
  }
  const Comparand& compared = term->forms_.front();
  const std::string_view required = wild ? compared.wildcards->Required() : compared.text;
  if (!required.empty() && IsAscii(required)) term->required_.emplace(required);
  const std::string_view of_folder = term->of_path_ && !term->literal_
                                         ? compared.wildcards->RequiredOfFolder()
                                         : std::string_view();
  if (!of_folder.empty() && IsAscii(of_folder)) term->required_of_folder_.emplace(of_folder);
  return std::shared_ptr<const TextTerm>(std::move(term));
}

namespace {

std::string LongestAsciiRun(std::string_view text) {
  std::string_view longest;
  for (size_t at = 0; at < text.size();) {
    size_t end = at;
    while (end < text.size() && static_cast<unsigned char>(text[end]) < 0x80) ++end;
    if (end - at > longest.size()) longest = text.substr(at, end - at);
    at = end + 1;
  }
  return AsciiLower(longest);
}

}  // namespace

std::vector<std::string> TextTerm::RequiredTexts() const {
  if (of_path_) return {};
  std::vector<std::string> all;
  if (regex_) {
    all.push_back(LiteralOf(text_, exact_));
  } else {
    for (const Comparand& form : forms_) {
      if (form.wildcards) {
        std::ranges::move(form.wildcards->RequiredTexts(), std::back_inserter(all));
      }
      if (literal_) all.push_back(form.text);
    }
    // Where letter case counts, names are compared as they are and not folded; what is ASCII stays
    // that when they are.
    if (exact_) std::ranges::transform(all, all.begin(), LongestAsciiRun);
  }
  if (std::ranges::any_of(all, &std::string::empty)) return {};
  return all;
}

std::string TextTerm::ScanExpression() const {
  if (exact_ || of_path_ || literal_ || !has_wildcards()) return {};
  std::string all;
  for (const Comparand& form : forms_) {
    const std::string one = form.wildcards->Expression(forms_.size() == 1);
    if (one.empty()) return one;
    all.append(all.empty() ? "" : "|").append(one);
  }
  return all;
}

// Whether one of the forms in which `text` is compared passes the test with the term's own.
template <class Test>
bool TextTerm::AnyForm(FoldedName& text, const Test& test) const {
  if (exact_) {
    if (test(text.ascii() ? text.name() : std::string_view(ComposeText(text.name())),
             forms_.front())) {
      return true;
    }
    return !text.valid_utf8() && test(text.name(), forms_.back());
  }
  if (test(text.folded(), forms_.front())) return true;
  if (!text.valid_utf8()) return forms_.size() > 1 && test(text.folded(), forms_.back());
  return plain_ && !text.ascii() && test(text.plain(), forms_.front());
}

bool TextTerm::Fits(std::string_view text, const Comparand& form) const {
  const bool anywhere = literal_ && text.find(form.text) != std::string_view::npos;
  if (anywhere || !form.wildcards) return anywhere;
  return form.wildcards->Matches(text);
}

// Whether what is required may be in one of the forms of a name that has it not.
bool TextTerm::MayHold(std::string_view name) const {
  thread_local std::string skeleton;
  return !AsciiSkeleton(name, skeleton) || required_->Finds(skeleton);
}

bool TextTerm::FindsIn(FoldedName& text) const {
  if (required_) {
    const bool there = required_->Finds(text.name());
    if (!there && (!MayFoldToAscii(text.name()) || !MayHold(text.name()))) return false;
    const bool enough = there && !has_wildcards() && !exact_;
    if (enough && IsAscii(text.name())) return true;
  }
  return AnyForm(text,
                 [this](std::string_view in, const Comparand& form) { return Fits(in, form); });
}

bool TextTerm::FindsInName(FoldedName& name) const {
  if (regex_) {
    const std::string_view text = name.name();
    return IsComposed(text) ? regex_->Finds(text) : regex_->Finds(ComposeText(text));
  }
  return FindsIn(name);
}

// A pasted path names the folder that is searched too, or begins within it.
bool TextTerm::Begins(FoldedName& path, std::string_view root) const {
  return AnyForm(path, [&](std::string_view in, const Comparand& form) {
    if (form.wildcards) return form.wildcards->Matches(in);
    if (!in.starts_with(form.text)) return false;
    const bool whole_name =
        form.text.ends_with('/') || in.size() == form.text.size() || in[form.text.size()] == '/';
    return whole_name || form.text.size() > root.size() + 1;
  });
}

bool TextTerm::FindsInPath(EntryPath& path) const {
  if (!text_.starts_with('/') || form_ == Form::kWhole) return FindsIn(path.below());
  return Begins(path.below(), "") || Begins(path.in_share(), path.base().in_share) ||
         Begins(path.on_disk(), path.base().on_disk);
}

bool TextTerm::FindsOnWay(const EntryPath& folder) const {
  const std::string_view way = folder.folder();
  FoldedName text;
  std::string path;
  for (size_t at = 0; at < way.size();) {
    const size_t end = std::min(way.find('/', at), way.size());
    if (of_path_) path.assign("/").append(way.substr(0, end)).append("/");
    text.Set(of_path_ ? std::string_view(path) : way.substr(at, end - at));
    if (FindsIn(text)) return true;
    at = end + 1;
  }
  return false;
}

namespace {

// Whether the path of something in `folder`, which ends with "/", may hold the text: the folder's
// own does, or the text goes on behind its last "/". A name holds none; a folder has one behind it.
bool GoesOnBelow(std::string_view folder, std::string_view text) {
  if (folder.find(text) != std::string_view::npos) return true;
  if (text.ends_with('/')) text.remove_suffix(1);
  const size_t slash = text.rfind('/');
  return slash == std::string_view::npos || folder.ends_with(text.substr(0, slash + 1));
}

}  // namespace

bool TextTerm::MayFitBelow(std::string_view folder) const {
  const bool from_root = text_.starts_with('/');
  return std::ranges::any_of(forms_, [&](const Comparand& form) {
    if (form.wildcards && form.wildcards->MayMatchBelow(folder)) return true;
    if (form.wildcards && (from_root || !literal_)) return false;
    if (!from_root) return GoesOnBelow(folder, form.text);
    return folder.starts_with(form.text) || form.text.starts_with(folder);
  });
}

// The path of what lies in a folder has the folder's path before it in each form, for nothing
// crosses a "/". But the form is that of bytes as soon as one name is not UTF-8.
bool TextTerm::ReachesInto(FoldedName& folder) const {
  thread_local std::string skeleton;
  if (required_of_folder_ && AsciiSkeleton(folder.name(), skeleton) &&
      !required_of_folder_->Finds(skeleton)) {
    return false;
  }
  if (exact_) return MayFitBelow(folder.name()) || MayFitBelow(ComposeText(folder.name()));
  if (IsAscii(folder.name())) return MayFitBelow(folder.folded());
  // Their parts in ASCII are the same in every form but for accents, which the skeleton leaves out.
  const bool ascii = !forms_.front().wildcards && IsAscii(text_);
  if (ascii && AsciiSkeleton(folder.name(), skeleton)) return MayFitBelow(skeleton);
  return MayFitBelow(folder.folded()) || MayFitBelow(folder.plain()) ||
         MayFitBelow(AsciiLower(folder.name()));
}

bool TextTerm::MayFindBelow(EntryPath& folder) const {
  if (!text_.starts_with('/')) return ReachesInto(folder.below());
  return ReachesInto(folder.below()) || ReachesInto(folder.in_share()) ||
         ReachesInto(folder.on_disk());
}

}  // namespace nas
