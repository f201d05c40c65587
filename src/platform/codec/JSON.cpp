#include "platform/codec/JSON.h"

#include "platform/codec/PropertyList.h"
#include "platform/codec/TreeBuilder.h"
#include "platform/text/Numbers.h"
#include "platform/text/UTF8.h"

#include <nlohmann/json.hpp>

#include <cmath>
#include <exception>
#include <limits>
#include <new>

namespace kvr {
namespace {

Error jsonError(std::string message) { return {"json", 0, std::move(message)}; }

Error errorAt(std::size_t position, const char* problem) {
  return jsonError(std::string(problem) + " at byte " + std::to_string(position));
}

/// Handles the parser's events; returning false stops it. The parser prescribes the names.
class Events {
 public:
  using Parser = nlohmann::json;

  bool null() { return builder_.add({}); }
  bool boolean(bool value) { return builder_.add(value); }
  bool number_integer(Parser::number_integer_t value) { return builder_.add(value); }
  bool number_unsigned(Parser::number_unsigned_t value) { return builder_.add(value); }
  bool number_float(Parser::number_float_t value, const std::string& /*text*/) { return builder_.add(value); }
  // Copies the text: the parser reuses its buffer, which would have to grow again after a move.
  bool string(const std::string& value) { return builder_.add(Value(value)); }
  bool key(const std::string& value) { return builder_.setKey(value); }
  bool binary(const Parser::binary_t& /*value*/) { return false; }
  bool start_object(std::size_t /*size*/) { return builder_.openDictionary(); }
  bool end_object() { return builder_.close(); }
  bool start_array(std::size_t /*size*/) { return builder_.openArray(); }
  bool end_array() { return builder_.close(); }
  bool parse_error(std::size_t position, const std::string& /*lastToken*/, const Parser::exception& error) {
    static constexpr int kNumberOverflow = 406;
    failure_ = errorAt(position, error.id == kNumberOverflow ? "number too large" : "syntax error");
    return false;
  }

  Result<Value> result() {
    if (failure_) return *std::move(failure_);
    if (!builder_.isComplete()) return jsonError(builder_.problem());
    return builder_.take();
  }

 private:
  TreeBuilder builder_{std::numeric_limits<std::size_t>::max()};
  std::optional<Error> failure_;
};

/// Recurses once per level, `kMaximumDepth` levels at most.
class Writer {
 public:
  explicit Writer(JSONSlashes slashes) : escapesSlashes_(slashes == JSONSlashes::Escaped) {}

  Result<std::string> write(const Value& tree) {
    if (!append(tree, 0)) return jsonError(problem_);
    return std::move(out_);
  }

 private:
  bool refuse(const char* problem) {
    problem_ = problem;
    return false;
  }

  bool append(const Value& value, std::size_t depth) {
    switch (value.kind()) {
      case Value::Kind::Null:
        out_ += "null";
        return true;
      case Value::Kind::Bool:
        out_ += value.boolean() ? "true" : "false";
        return true;
      case Value::Kind::Int:
        appendNumber(out_, value.integer());
        return true;
      case Value::Kind::UInt:
        appendNumber(out_, value.unsignedInteger());
        return true;
      case Value::Kind::Real:
        return appendReal(value.real());
      case Value::Kind::String:
        return appendString(value.string());
      case Value::Kind::Date:
        return refuse("JSON holds no date");
      case Value::Kind::Data:
        return refuse("JSON holds no data");
      case Value::Kind::Array:
        return appendArray(value.array(), depth + 1);
      case Value::Kind::Dictionary:
        return appendDictionary(value.dictionary(), depth + 1);
    }
    return false;
  }

  bool appendArray(const Value::Array& array, std::size_t depth) {
    if (depth > kMaximumDepth) return refuse("nested too deep");
    char separator = '[';
    for (const auto& element : array) {
      out_ += std::exchange(separator, ',');
      if (!append(element, depth)) return false;
    }
    out_ += array.empty() ? "[]" : "]";
    return true;
  }

  bool appendDictionary(const Value::Dictionary& dictionary, std::size_t depth) {
    if (depth > kMaximumDepth) return refuse("nested too deep");
    char separator = '{';
    for (const auto& [key, element] : dictionary) {
      out_ += std::exchange(separator, ',');
      if (!appendString(key)) return false;
      out_ += ':';
      if (!append(element, depth)) return false;
    }
    out_ += dictionary.empty() ? "{}" : "}";
    return true;
  }

  bool appendReal(double number) {
    if (!std::isfinite(number)) return refuse("JSON holds no number that is not finite");
    const auto start = out_.size();
    appendNumber(out_, number);
    // Without a fraction or an exponent it would come back as an integer.
    if (out_.find_first_of(".e", start) == std::string::npos) out_ += ".0";
    return true;
  }

  bool appendString(std::string_view text) {
    out_ += '"';
    std::size_t written = 0;
    for (std::size_t at = 0; at < text.size();) {
      const char c = text[at];
      if (static_cast<unsigned char>(c) >= 0x80) {
        if (nextCodePoint(text, at) == kNoCodePoint) return refuse("text that is not UTF-8");
        continue;
      }
      if (static_cast<unsigned char>(c) < 0x20 || c == '"' || c == '\\' || (c == '/' && escapesSlashes_)) {
        out_ += text.substr(written, at - written);
        appendEscaped(c);
        written = at + 1;
      }
      ++at;
    }
    out_ += text.substr(written);
    out_ += '"';
    return true;
  }

  void appendEscaped(char c) {
    static constexpr char kDigits[] = "0123456789abcdef";
    out_ += '\\';
    switch (c) {
      case '\b':
        out_ += 'b';
        break;
      case '\f':
        out_ += 'f';
        break;
      case '\n':
        out_ += 'n';
        break;
      case '\r':
        out_ += 'r';
        break;
      case '\t':
        out_ += 't';
        break;
      case '"':
      case '\\':
      case '/':
        out_ += c;
        break;
      default:
        out_ += "u00";
        out_ += kDigits[static_cast<unsigned char>(c) >> 4U];
        out_ += kDigits[static_cast<unsigned char>(c) & 0xFU];
    }
  }

  const bool escapesSlashes_;
  std::string out_;
  const char* problem_ = "";
};

}  // namespace

Result<Value> readJSON(std::string_view bytes) {
  // JSON cannot contain a NUL, and the parser would take one for the end of the text.
  if (const auto nul = bytes.find('\0'); nul != std::string_view::npos) return errorAt(nul, "NUL");
  try {
    Events events;
    nlohmann::json::sax_parse(bytes.begin(), bytes.end(), &events);
    return events.result();
  } catch (const std::bad_alloc&) {
    throw;
  } catch (const std::exception& exception) {
    return jsonError(exception.what());
  }
}

Result<std::string> writeJSON(const Value& tree, JSONSlashes slashes) { return Writer(slashes).write(tree); }

}  // namespace kvr
