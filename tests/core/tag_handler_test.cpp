#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "core/header/element_handlers.h"
#include "core/status.h"
#include "host/heap_control.h"
#include "platform/ao_log.h"
#include "tests/support/ebml_builder.h"
#include "tests/support/header_parse.h"
#include "tests/support/log_recorder.h"

namespace {

using namespace ebml;
using testing_support::HeaderParse;
using testing_support::HeaderParseOptions;
using testing_support::LogRecorder;

constexpr const char* kTooManyTags = "kelvane:  Too many tags.  Some metadata may be missing.";

int run_handler(HeaderParse& parse, const Bytes& payload) {
  uint32_t id = kTags;
  uint64_t size = payload.size();
  return mkv_tag_handler(&parse.info(), &parse.stream(), &id, &size);
}

Bytes simple_tag(std::string_view name, std::string_view value) {
  return master(kSimpleTag, {str(kTagName, name), str(kTagString, value)});
}

// Each entry as "name=string/binary-bytes/length", null fields as "-".
std::vector<std::string> entries(const mkv_file_info& info) {
  std::vector<std::string> out;
  for (uint32_t i = 0; i < info.tag_count; ++i) {
    const mkv_tag_entry& tag = info.tags[i];
    out.push_back(std::string(tag.name ? tag.name : "-") + "=" + (tag.string ? tag.string : "-") + "/" +
                  (tag.binary ? std::string(reinterpret_cast<const char*>(tag.binary), tag.length) : "-") + "/" +
                  std::to_string(tag.length));
  }
  return out;
}

// Plain tags of real files are compared in the fixture test.
TEST(TagHandlerTest, EachSimpleTagFillsTheNextEntry) {
  const struct {
    const char* name;
    Bytes payload;
    std::vector<std::string> tags;
  } cases[] = {
      {"nested SimpleTag gets its own entry and stays current",
       master(kSimpleTag, {str(kTagName, "A"), simple_tag("B", "bb"), str(kTagString, "late")}),
       {"A=-/-/0", "B=bb/-/2"}},
      {"first name and string stand", master(kSimpleTag, {str(kTagName, "A"), str(kTagName, "B"), str(kTagString, "1"),
                                                          str(kTagString, "22")}),
       {"A=1/-/1"}},
      {"binary counts its bytes", master(kSimpleTag, {str(kTagName, "COVER"), bin(kTagBinary, {'p', 'n', 'g', 0, 1})}),
       {std::string("COVER=-/png") + '\0' + "\x01/5"}},
      {"length is the value read last", master(kSimpleTag, {str(kTagString, "four"), bin(kTagBinary, {'b', 'i'})}),
       {"-=four/bi/2"}},
      {"values before any SimpleTag are skipped", cat({str(kTagName, "X"), str(kTagString, "Y"), simple_tag("T", "v")}),
       {"T=v/-/1"}},
      {"empty name and string", master(kSimpleTag, {str(kTagName, ""), str(kTagString, ""), uinteger(kTagLanguage, 0)}),
       {"=/-/0"}},
  };
  for (const auto& c : cases) {
    HeaderParse parse(c.payload);
    ASSERT_EQ(run_handler(parse, c.payload), kStatusOk) << c.name;
    EXPECT_EQ(entries(parse.info()), c.tags) << c.name;
  }
}

TEST(TagHandlerTest, ValuesBeyondTheirLimitFailWithTheExactMessage) {
  const struct {
    const char* name;
    Bytes payload;
    bool with_limits;
    int status;
    const char* message;  // null: nothing logged
  } cases[] = {
      {"name of 8192", master(kSimpleTag, {str(kTagName, std::string(8192, 'n'))}), true, kStatusOk, nullptr},
      {"name of 8193", master(kSimpleTag, {str(kTagName, std::string(8193, 'n'))}), true, kStatusNoMemory,
       "Error allocating tag name of size 8193"},
      {"name of 8193 without limits", master(kSimpleTag, {str(kTagName, std::string(8193, 'n'))}), false, kStatusOk, nullptr},
      {"string of 8193", master(kSimpleTag, {str(kTagString, std::string(8193, 's'))}), true, kStatusNoMemory,
       "Error allocating tag string of size 8193"},
      {"binary of 32768", master(kSimpleTag, {bin(kTagBinary, filler(32768))}), false, kStatusOk, nullptr},
      {"binary of 32769", master(kSimpleTag, {bin(kTagBinary, filler(32769))}), false, kStatusNoMemory,
       "Error allocating tag binary of size 32769"},
      {"string claiming 2^32 bytes", cat({id_bytes(kSimpleTag), size_bytes(20), id_bytes(kTagString), size_bytes(1ull << 32)}),
       false, kStatusNoMemory, "Error allocating tag string of size 4294967296"},
  };
  for (const auto& c : cases) {
    LogRecorder log;
    HeaderParse parse(c.payload, HeaderParseOptions{.with_limits = c.with_limits});
    EXPECT_EQ(run_handler(parse, c.payload), c.status) << c.name;
    if (c.message) {
      EXPECT_TRUE(log.Contains(kAoLogNotice, c.message)) << c.name;
      const mkv_tag_entry& tag = parse.info().tags[0];
      EXPECT_TRUE(!tag.name && !tag.string && !tag.binary) << c.name;
    } else {
      EXPECT_TRUE(log.messages().empty()) << c.name;
    }
  }
}

TEST(TagHandlerTest, ValueCutByTheEndOfTheFileIsReadFailure) {
  for (uint32_t id : {uint32_t{kTagName}, uint32_t{kTagString}, uint32_t{kTagBinary}}) {
    Bytes payload = cat({id_bytes(kSimpleTag), size_bytes(40), id_bytes(id), size_bytes(10), Bytes{'a', 'b', 'c'}});
    int64_t live = host::LiveBlockCount();
    {
      HeaderParse parse(payload);
      Bytes claimed = payload;
      claimed.resize(payload.size() + 7);
      EXPECT_EQ(run_handler(parse, claimed), kStatusReadFailed) << id;
      EXPECT_LE(parse.info().tags[0].length, 3u) << id;  // never more than arrived
    }
    EXPECT_EQ(host::LiveBlockCount(), live) << id;
  }
}

TEST(TagHandlerTest, FiftyTagsAreKeptAndTheFiftyFirstIsLoggedAndDropped) {
  for (int count : {50, 51}) {
    Bytes payload;
    for (int i = 0; i < count; ++i) {
      Bytes tag = simple_tag("T" + std::to_string(i), "v" + std::to_string(i));
      payload.insert(payload.end(), tag.begin(), tag.end());
    }
    Bytes behind = simple_tag("AFTER", "x");
    LogRecorder log;
    HeaderParse parse(cat({payload, behind}));
    EXPECT_EQ(run_handler(parse, payload), kStatusOk) << count;
    EXPECT_EQ(parse.info().tag_count, 50u) << count;
    EXPECT_STREQ(parse.info().tags[49].name, "T49") << count;
    EXPECT_STREQ(parse.info().tags[49].string, "v49") << count;
    EXPECT_EQ(log.Contains(kAoLogNotice, kTooManyTags), count > 50) << count;
    EXPECT_EQ(mkvvstream_tell(&parse.stream()), payload.size()) << count;

    // A further Tags element finds every entry taken.
    if (count == 50) {
      EXPECT_EQ(run_handler(parse, behind), kStatusOk);
      EXPECT_EQ(parse.info().tag_count, 50u);
      EXPECT_TRUE(log.Contains(kAoLogNotice, kTooManyTags));
    }
  }
}

}  // namespace
