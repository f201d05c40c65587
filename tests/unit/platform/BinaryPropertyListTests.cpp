#include "Trees.h"
#include "platform/codec/BinaryPropertyList.h"

namespace kvr {
namespace {

using namespace std::string_literals;

std::string bigEndian(std::uint64_t number, std::size_t size) {
  std::string out;
  for (auto shift = size * 8; shift > 0;) out += static_cast<char>(number >> (shift -= 8) & 0xFFU);
  return out;
}

struct Trailer {
  std::uint64_t offsetSize = 4;
  std::uint64_t referenceSize = 2;
  std::uint64_t count;
  std::uint64_t top = 0;
  std::uint64_t table;
};

std::string bytesOf(const Trailer& trailer) {
  return std::string(6, '\0') + bigEndian(trailer.offsetSize, 1) + bigEndian(trailer.referenceSize, 1) +
         bigEndian(trailer.count, 8) + bigEndian(trailer.top, 8) + bigEndian(trailer.table, 8);
}

/// A property list of these objects with two-byte references; the first object is the root.
std::string listOf(const std::vector<std::string>& objects) {
  std::string out = "bplist00";
  std::string table;
  for (const auto& object : objects) {
    table += bigEndian(out.size(), 4);
    out += object;
  }
  return out + table + bytesOf({.count = objects.size(), .table = out.size()});
}

/// An array of references to these objects.
std::string arrayOf(const std::vector<unsigned>& objects) {
  std::string out = "\xAF\x12"s + bigEndian(objects.size(), 4);
  for (const auto object : objects) out += bigEndian(object, 2);
  return out;
}

/// `levels` arrays, each of which refers to the next one twice; the last one refers to the string twice.
std::vector<std::string> doublingArrays(unsigned levels, const std::string& string) {
  std::vector<std::string> objects;
  for (unsigned i = 1; i <= levels; ++i) objects.push_back(arrayOf({i, i}));
  objects.push_back(string);
  return objects;
}

const auto kOne = "\x10\x01"s;
const auto kKey = "\x51k"s;

TEST(ABinaryObject, IsReadAsItsKind) {
  const TreesByText cases = {
      {"\x00"s, {}},
      {"\x08", false},
      {"\x10\xFF", 255},
      {"\x12\xFF\xFF\xFF\xFF", 4294967295},
      {"\x13\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF", -1},
      {"\x14" + bigEndian(0, 8) + bigEndian(~0ULL, 8), std::numeric_limits<std::uint64_t>::max()},
      {"\x14" + bigEndian(~0ULL, 8) + bigEndian(~0ULL, 8), -1},
      {"\x22\x3F\x80\x00\x00"s, 1.0},
      {"\x23\x3F\xF0\x00\x00\x00\x00\x00\x00"s, 1.0},
      {"\x33" + bigEndian(0, 8), Date{978307200}},
      {"\x42\x01\x02", Value::Bytes{1, 2}},
      {"\x4F\x10\x01\x07"s, Value::Bytes{7}},
      {"\x50", ""},
      {"\x61\x20\x28", "\u2028"},
      {"\x62\xD8\x3D\xDE\x00"s, "\U0001F600"},
      {"\xD0", Dictionary{}}};
  expectTrees([](std::string_view object) { return readPropertyList(listOf({std::string(object)})); }, cases);
}

TEST(ABinaryPropertyList, IsRefusedForAnyFault) {
  const auto count = [](std::string_view marker, std::uint64_t length) {
    return std::string(marker) + "\x13" + bigEndian(length, 8);
  };
  const FaultsByText cases = {
      {listOf({"\x0F"}), "an object of unknown kind"},
      {listOf({"\x12\x01\x02"}), "damaged integer"},
      {listOf({"\x15" + std::string(32, '\0')}), "damaged integer"},
      {listOf({"\x14" + bigEndian(1, 8) + bigEndian(0, 8)}), "integer too large"},
      {listOf({"\x14" + bigEndian(~0ULL, 8) + bigEndian(1, 8)}), "integer too large"},
      {listOf({"\x21\x01\x02"}), "damaged real"},
      {listOf({"\x32\x01\x02\x03\x04"}), "damaged date"},
      {listOf({"\x51\x80"}), "a string that is not ASCII as it says"},
      {listOf({"\x61\xD8\x3D"}), "a string with half a character"},
      {listOf({"\x62\xD8\x3D\x00\x41"s}), "a string with half a character"},
      {listOf({"\x5F\x23\x00"s}), "damaged length"},
      {listOf({"\x5F\x14" + std::string(16, '\0')}), "damaged length"},
      {listOf({count("\x5F", ~0ULL)}), "a length beyond the objects"},
      {listOf({count("\xDF", 1ULL << 62U)}), "a length beyond the objects"},
      {listOf({arrayOf({7}), kOne}), "a reference to no object"},
      {listOf({arrayOf({0})}), "a container inside itself"},
      {listOf({arrayOf({1}), "\xD1\x00\x02\x00\x00"s, kKey}), "a container inside itself"},
      {listOf({"\xD1\x00\x01\x00\x01"s, kOne}), "a key that is not a string"},
      {listOf(doublingArrays(20, kOne)), "unfolds to too much"},
      {listOf(doublingArrays(12, "\x5F\x12" + bigEndian(100'000, 4) + std::string(100'000, 'x'))),
       "unfolds to too much"}};
  expectFaults(readPropertyList, "plist", cases);
}

TEST(ABinaryPropertyList, IsRefusedForAnyFaultOfItsTrailer) {
  const auto list = [](const Trailer& trailer, std::uint64_t offset) {
    return readPropertyList("bplist00" + kOne + bigEndian(offset, 4) + bytesOf(trailer));
  };
  const Trailer good{.count = 1, .table = 10};
  ASSERT_TRUE(list(good, 8));
  const std::pair<std::uint64_t Trailer::*, std::vector<std::uint64_t>> faults[] = {
      {&Trailer::count, {0, 2, ~0ULL}},     {&Trailer::top, {1, ~0ULL}},
      {&Trailer::table, {0, 8, 14, ~0ULL}}, {&Trailer::offsetSize, {0, 9}},
      {&Trailer::referenceSize, {0, 9}},
  };
  for (const auto& [member, values] : faults) {
    for (const auto value : values) {
      Trailer trailer = good;
      trailer.*member = value;
      EXPECT_FALSE(list(trailer, 8)) << value;
    }
  }
  for (const std::uint64_t offset : {0U, 7U, 10U, 0xFFFFFFFFU}) EXPECT_FALSE(list(good, offset));
}

TEST(ABinaryPropertyList, CannotClaimTheSameBytesWithoutEnd) {
  // Many strings, or the keys of many dictionaries, that all refer to the same megabyte.
  constexpr unsigned kMany = 1000;
  const auto string = "\x5F\x12" + bigEndian(1 << 20, 4) + std::string(1 << 20, 'x');
  std::vector<unsigned> all;
  for (unsigned i = 0; i < kMany; ++i) all.push_back(i + 2);
  const std::string start = "bplist00" + arrayOf(all);
  const std::string dictionary = "\xD1\x00\x01\x00\x01"s;
  for (const bool asKeys : {false, true}) {
    std::string table = bigEndian(8, 4) + bigEndian(start.size() + dictionary.size(), 4);
    table += repeated(bigEndian(start.size() + (asKeys ? 0 : dictionary.size()), 4), kMany);
    const auto body = start + dictionary + string;
    const auto read = readPropertyList(body + table + bytesOf({.count = kMany + 2, .table = body.size()}));
    ASSERT_FALSE(read);
    EXPECT_EQ(read.error().message, "unfolds to too much text");
  }
}

TEST(ABinaryPropertyList, MayBeNestedToTheLimitAndNoFurther) {
  const auto chain = [](unsigned depth) {
    std::vector<std::string> objects;
    for (unsigned i = 1; i <= depth; ++i) objects.push_back(arrayOf({i}));
    objects.push_back(kOne);
    return readPropertyList(listOf(objects));
  };
  EXPECT_TRUE(chain(kMaximumDepth));
  EXPECT_FALSE(chain(kMaximumDepth + 1));
  EXPECT_FALSE(chain(60'000));
  // Deep below one reference, deeper still below another that is followed later.
  std::vector<std::string> objects{arrayOf({2, 1}), arrayOf({2})};
  for (unsigned i = 3; i <= kMaximumDepth + 1; ++i) objects.push_back(arrayOf({i}));
  objects.push_back(kOne);
  EXPECT_FALSE(readPropertyList(listOf(objects)));
}

TEST(ABinaryPropertyList, IsWrittenWithEqualLeavesOnceAndTheSmallestSizes) {
  const Value tree = Array{"k", "k", 1, 1, Dictionary{{"k", true}}};
  const auto objects = "\xA5\x01\x01\x02\x02\x03\x51k\x10\x01\xD1\x01\x04\x09"s;
  EXPECT_EQ(*writePropertyList(tree, PropertyListEncoding::Binary),
            "bplist00" + objects + "\x08\x0E\x10\x12\x15"s +
                bytesOf({.offsetSize = 1, .referenceSize = 1, .count = 5, .table = 8 + objects.size()}));
}

TEST(ABinaryPropertyList, IsWrittenSoThatItCanBeReadHoweverMuchIsShared) {
  // The last one shares keys up to the limit.
  const Value trees[] = {Array(100, Value(std::string(1 << 20, 'x'))),
                         Array(1119, Dictionary{{std::string(60'000, 'k'), 1}})};
  for (const auto& tree : trees) {
    EXPECT_TRUE(*readPropertyList(*writePropertyList(tree, PropertyListEncoding::Binary)) == tree);
  }
}

}  // namespace
}  // namespace kvr
