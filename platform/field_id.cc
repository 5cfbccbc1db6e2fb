#include "platform/field_id.h"

#include <charconv>
#include <vector>

#include "platform/error.h"

namespace vemo {

namespace {

// Reads a whole decimal number without leading zeros.
template <class Number>
bool ParseNumber(std::string_view text, Number& number) {
  if (text.empty() || (text.size() > 1 && text[0] == '0')) return false;
  const auto result = std::from_chars(text.data(), text.data() + text.size(), number);
  return result.ec == std::errc() && result.ptr == text.data() + text.size();
}

bool ParsePath(std::string_view text, std::vector<Path::Element>& elements) {
  while (!text.empty()) {
    const std::size_t dot = text.find('.');
    Path::Element element = 0;
    if (!ParseNumber(text.substr(0, dot), element)) return false;
    elements.push_back(element);
    if (dot == std::string_view::npos) return true;
    text.remove_prefix(dot + 1);
  }
  return elements.empty();
}

}  // namespace

std::string FieldIdText(const FieldId& field) {
  std::string text = std::to_string(field.oid.m_value) + ':';
  bool first = true;
  for (const Path::Element element : field.path.elements()) {
    if (!first) text.push_back('.');
    first = false;
    text += std::to_string(element);
  }
  return text;
}

xostream& operator<<(xostream& os, const FieldId& field) { return os.put(FieldIdText(field)); }

FieldId ParseFieldId(std::string_view text) {
  const std::size_t colon = text.find(':');
  std::uint64_t oid = 0;
  std::vector<Path::Element> elements;
  if (colon == std::string_view::npos || !ParseNumber(text.substr(0, colon), oid) || oid == 0 ||
      !ParsePath(text.substr(colon + 1), elements)) {
    throw UsageError("\"" + std::string(text) + "\" is not a field of the form OBJECT:STEP.STEP, such as 1:0.3");
  }
  return FieldId{OID(oid), Path(std::span<const Path::Element>(elements))};
}

}  // namespace vemo
