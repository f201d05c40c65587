#include "platform/codec/PropertyList.h"

#include "platform/codec/ASCIIPropertyList.h"
#include "platform/codec/BinaryPropertyList.h"
#include "platform/codec/PropertyListLimits.h"
#include "platform/codec/XMLPropertyList.h"

#include <algorithm>
#include <string>
#include <utility>

namespace kvr {
namespace {

/// How the characters of a text are stored in its bytes.
struct Layout {
  std::size_t mark;  ///< length of the byte order mark
  std::size_t unitSize;
  std::size_t lowByte;  ///< position of the low byte in a unit
};

Layout layoutOf(std::string_view bytes) {
  using namespace std::string_view_literals;
  if (bytes.starts_with("\xEF\xBB\xBF")) return {3, 1, 0};
  if (bytes.starts_with("\xFE\xFF")) return {2, 2, 1};
  if (bytes.starts_with("\xFF\xFE")) return {2, 2, 0};
  if (bytes.starts_with("\0<"sv)) return {0, 2, 1};
  if (bytes.starts_with("<\0"sv)) return {0, 2, 0};
  return {0, 1, 0};
}

/// The character at `at`; NUL beyond the end and for a character that does not fit one byte.
char characterAt(std::string_view bytes, std::size_t at, const Layout& layout) {
  if (bytes.size() - at < layout.unitSize) return '\0';
  if (layout.unitSize == 2 && bytes[at + 1 - layout.lowByte] != '\0') return '\0';
  return bytes[at + layout.lowByte];
}

/// The part of the bytes that an XML parser should see, or nothing when they do not start like XML.
std::optional<std::string_view> xmlDocument(std::string_view bytes) {
  const auto layout = layoutOf(bytes);
  auto at = layout.mark;
  while (std::string_view(" \t\n\r").find(characterAt(bytes, at, layout)) != std::string_view::npos) {
    at += layout.unitSize;
  }
  std::string start;
  for (std::size_t i = 0; i < 6; ++i)
    start += characterAt(bytes, std::min(at + i * layout.unitSize, bytes.size()), layout);
  // A document type or a comment may come first; nothing of the old text form starts with "<!".
  if (!start.starts_with("<?xml") && !start.starts_with("<plist") && !start.starts_with("<!"))
    return std::nullopt;
  // An XML declaration must come first, so blanks before it are dropped, and the byte order mark with them.
  return at == layout.mark ? bytes : bytes.substr(at);
}

}  // namespace

Result<Value> readPropertyList(std::string_view bytes) {
  if (bytes.starts_with("bplist")) return readBinaryPropertyList(bytes);
  if (const auto document = xmlDocument(bytes)) return readXMLPropertyList(*document);
  return readASCIIPropertyList(bytes);
}

Result<PartialTree> readPropertyListWithin(const TreeExtent& most, std::string_view bytes, EntryKeys keys) {
  if (bytes.starts_with("bplist")) return readBinaryPropertyListWithin(most, bytes, keys);
  const auto document = xmlDocument(bytes);
  const auto read = [&](TreeBuilder builder) {
    return document ? readXMLPropertyList(*document, std::move(builder))
                    : readASCIIPropertyList(bytes, std::move(builder));
  };
  auto whole = read(TreeBuilder(std::min(most.values, kMaximumValues)));
  if (whole) return PartialTree{*std::move(whole), true};
  // A damaged list fails this read too; then the first error is returned.
  auto part = read(TreeBuilder(keys));
  if (!part) return whole.error();
  return PartialTree{*std::move(part), false};
}

Result<std::string> writePropertyList(const Value& tree, PropertyListEncoding encoding) {
  return encoding == PropertyListEncoding::XML ? writeXMLPropertyList(tree) : writeBinaryPropertyList(tree);
}

}  // namespace kvr
