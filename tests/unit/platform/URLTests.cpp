#include "Prelude.h"
#include "platform/text/URL.h"

namespace kvr {
namespace {

TEST(AURL, IsTakenApart) {
  const std::tuple<const char*, const char*, const char*, const char*, bool> cases[] = {
      {"https://a.example/b?c#d", "https", "a.example", "", false},
      {"HTTPS://A.Example:443", "https", "a.example", "", false},
      {"http://localhost:80/", "http", "localhost", "", true},
      {"http://127.0.0.1", "http", "127.0.0.1", "", true},
      {"http://127.255.3.4:1/x", "http", "127.255.3.4", "", true},
      {"http://[::1]:8080/x", "http", "::1", "", true},
      {"http://localhost@a.example/", "http", "a.example", "", false},
      {"http://a@b@localhost:1/", "http", "localhost", "", true},
      {"http://a.example/@localhost", "http", "a.example", "", false},
      {"http://localhost.a.example", "http", "localhost.a.example", "", false},
      {"http://127.0.0.256/", "http", "127.0.0.256", "", false},
      {"http://127.0.0.1./", "http", "127.0.0.1.", "", false},
      {"http://[::ffff:1.2.3.4]/", "http", "::ffff:1.2.3.4", "", false},
      {"file:///a/b%20c.plist", "file", "", "/a/b c.plist", false},
      {"file://localhost/a?b", "file", "", "/a", false},
      {"file:/a/%C3%A9", "file", "", "/a/\xC3\xA9", false},
      {"mailto:a@b", "mailto", "", "", false}};
  for (const auto& [text, scheme, host, filePath, isLoopback] : cases) {
    const auto url = URL::parse(text);
    ASSERT_TRUE(url) << text;
    EXPECT_EQ(url->text(), text);
    EXPECT_EQ(url->scheme(), scheme) << text;
    EXPECT_EQ(url->host(), host) << text;
    EXPECT_EQ(url->filePath(), filePath) << text;
    EXPECT_EQ(url->isLoopback(), isLoopback) << text;
  }
}

TEST(AURL, IsNothingWhenTheTextIsNone) {
  const std::vector<std::string_view> kGroups[] = {
      {"", "a", "/a/b", "://a", "1a://b", " http://a", "http:", "http:a", "http://", "https:///a"},
      {"http://:80/", "http://u@/", "http://a b/", "http://a\n", {"http://a/\0", 10}, "http://a/\x7f"},
      {"http://a:b/", "http://a:65536", "http://a:1:2", "http://a\\b/", "http://a%2eb/"},
      {"http://[::1", "http://[::1]a/", "http://[]/", "http://[a.example]/"},
      {"file:", "file:a", "file://", "file://a.example/b"},
      {"file:///a%", "file:///a%4", "file:///a%zz", "file:///a%00b"}};
  for (const auto& texts : kGroups) {
    for (const auto text : texts) EXPECT_FALSE(URL::parse(text)) << text;
  }
}

TEST(AFileURL, IsReadBackToItsPath) {
  for (const std::string path : {"/a/b.plist", "/", "/a b/100%/#?.plist", "/\xC3\xA9\xFF", "/a\nb"}) {
    const URL url = URL::fileURL(path);
    const auto again = URL::parse(url.text());
    ASSERT_TRUE(again) << url.text();
    EXPECT_TRUE(again->isFile());
    EXPECT_EQ(again->filePath(), path);
  }
}

}  // namespace
}  // namespace kvr
