// The form of trace lines, and of the dump of a parameter set.
#include "ta/base/trace.h"

#include "fixture.h"
#include "ta/params/dump.h"

namespace keymaster {
namespace {

using Trace = platform::fixture;

TEST_F(Trace, NamesLevelThreadFunctionAndLine) {
  // Level, thread, message, and the line.
  const std::tuple<uint32_t, uint32_t, const char*, const char*> cases[] = {
      {1, 0x2a, "newline\n", "ERR [0x2a] KEYMASTER:begin:120: newline\n"},
      {1, 0x2a, "none", "ERR [0x2a] KEYMASTER:begin:120: none\n"},
      {2, 0, "", "INF KEYMASTER:begin:120: \n"},
      {3, 1, "x", "DBG [0x1] KEYMASTER:begin:120: x\n"},
      {4, 1, "x", "FLW [0x1] KEYMASTER:begin:120: x\n"},
      {0, 1, "x", "UKN [0x1] KEYMASTER:begin:120: x\n"},
  };
  platform::trace_threshold = TEE_TRACE_FLOW;
  const trace_scope scope("begin");
  for (const auto& [level, thread, message, line] : cases) {
    platform::trace_lines.clear();
    platform::trace_thread = thread;
    trace({level, 120}, "%s", message);
    EXPECT_EQ(platform::trace_lines, std::vector<std::string>{line});
  }
}

TEST_F(Trace, GoesOutUnderTheInnermostOpenName) {
  trace_scope::reset();
  const auto helper = [](const char* message) { return fail(TEE_ERROR_GENERIC, "%s", message); };
  const auto inner = [&] {
    const trace_scope scope("inner");
    return helper("b");
  };
  {
    const trace_scope scope;
    EXPECT_EQ(helper("a"), TEE_ERROR_GENERIC);
    EXPECT_EQ(inner(), TEE_ERROR_GENERIC);
    EXPECT_EQ(refuse(KM_ERROR_INVALID_TAG, "c"), KM_ERROR_INVALID_TAG);
    trace(TEE_TRACE_ERROR, "d");
  }
  const int line = __LINE__ - 2;
  EXPECT_EQ(helper("e"), TEE_ERROR_GENERIC);
  std::string names;
  for (const std::string& text : platform::trace_lines) {
    const size_t name = text.find("KEYMASTER:") + 10;
    names += text.substr(name, text.find(':', name) - name) + " ";
  }
  EXPECT_EQ(names, "TestBody inner TestBody TestBody  ");
  EXPECT_NE(platform::trace_lines[3].find("TestBody:" + std::to_string(line)), std::string::npos);
}

TEST_F(Trace, CutsLinesAt256BytesAndKeepsTheirNewline) {
  const trace_scope scope("begin");
  const size_t prefix = std::string("ERR [0x2a] KEYMASTER:begin:120: ").size();
  for (const size_t length : {255 - prefix, 256 - prefix, size_t{300}, size_t{5000}}) {
    platform::trace_lines.clear();
    const std::string message(length, 'x');
    trace({TEE_TRACE_ERROR, 120}, "%s", message.c_str());
    ASSERT_EQ(platform::trace_lines.size(), 1u);
    const std::string& line = platform::trace_lines[0];
    EXPECT_EQ(line.size(), 256u) << length;
    EXPECT_EQ(line.substr(254), "x\n") << length;
  }
  platform::trace_lines.clear();
  const std::string name(400, 'f');
  const trace_scope long_name(name.c_str());
  trace(TEE_TRACE_ERROR, "message");
  EXPECT_EQ(platform::trace_lines[0].size(), 256u);
  EXPECT_EQ(platform::trace_lines[0].back(), '\n');
}

TEST_F(Trace, DumpsEachClassOfTag) {
  const std::tuple<keymaster_tag_t, uint64_t, const char*> cases[] = {
      {KM_INVALID | 5, 1, "    KM_INVALID"},
      {KM_TAG_ALGORITHM, 0xFFFFFFFF, "    KM_ENUM: -1"},
      {KM_TAG_PURPOSE, 3, "    KM_ENUM: 3"},
      {KM_TAG_KEY_SIZE, 256, "    KM_UINT: 0x00000100"},
      {KM_UINT_REP | 5, 1, "    KM_UINT: 0x00000001"},
      {KM_TAG_RSA_PUBLIC_EXPONENT, 0x100000000, "    KM_ULONG: 0x0000000100000000"},
      {KM_TAG_USER_SECURE_ID, 2, "    KM_ULONG: 0x0000000000000002"},
      {KM_TAG_ACTIVE_DATETIME, 0x123456789A, "    KM_DATE: 0x000000123456789a"},
      {KM_TAG_NO_AUTH_REQUIRED, 1, "    KM_BOOL: 1"},
      {KM_BIGNUM | 5, 0, "    KM_BIGNUM, length 0B"},
      {KM_TAG_NONCE, 0, "    KM_BYTES, length 0B"},
      {0xB0000000, 0, "    Invalid tag type"},
  };
  for (const auto& [tag, value, line] : cases) {
    keymaster_key_param_set_t set;
    ASSERT_TRUE(add_long(&set, tag, has_blob(tag) ? 0 : value));
    platform::trace_lines.clear();
    _keymaster_dump_key_param_set("begin.cpp", 99, set);
    ASSERT_EQ(platform::trace_lines.size(), 3u);
    EXPECT_NE(platform::trace_lines[0].find(":_keymaster_dump_key_param_set:"), std::string::npos);
    EXPECT_TRUE(platform::trace_lines[0].ends_with(": Dump at begin.cpp:99\n"));
    EXPECT_TRUE(platform::traced(line)) << platform::trace_lines[2];
  }
}

}  // namespace
}  // namespace keymaster
