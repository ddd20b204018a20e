// H4 reassembly: whole packets out however the stream is cut, bad type bytes.
#include "host/hal/h4_stream.h"

#include <gtest/gtest.h>

#include "tests/host/host_test_support.h"

namespace {

class H4StreamTest : public ::testing::Test {
  protected:
    // Feeds the stream in the given cuts; false if the stream was rejected.
    bool feedCuts(const Bytes& stream, const std::vector<size_t>& cuts) {
        size_t at = 0;
        for (size_t cut : cuts) {
            if (!feedRange(stream, at, cut)) return false;
            at = cut;
        }
        return feedRange(stream, at, stream.size());
    }
    bool feedRange(const Bytes& stream, size_t from, size_t to) {
        auto sink = [this](const H4Packet& p) { out.push_back({p.type, p.bytes}); };
        return parser.feed(stream.data() + from, to - from, sink);
    }

    H4Stream parser;
    std::vector<Received> out;
};

Bytes repeat(size_t n, uint8_t first) {
    Bytes b;
    for (size_t i = 0; i < n; ++i) b.push_back(static_cast<uint8_t>(first + i));
    return b;
}

// One of each type, with empty and maximum-length payloads.
std::vector<Received> samplePackets() {
    Bytes event255 = {0x0E, 0xFF};
    Bytes params = repeat(255, 1);
    event255.insert(event255.end(), params.begin(), params.end());
    Bytes acl = {0x01, 0x20, 0x00, 0x01};  // 256 bytes of data
    Bytes data = repeat(256, 0);
    acl.insert(acl.end(), data.begin(), data.end());
    return {
            {4, {0x0E, 0x04, 0x01, 0x03, 0x0C, 0x00}},
            {2, {0x01, 0x20, 0x00, 0x00}},          // ACL without data
            {3, {0x02, 0x00, 0x03, 0xAA, 0xBB, 0xCC}},
            {4, event255},
            {4, {0x13, 0x00}},                      // event without parameters
            {2, acl},
            {1, {0x03, 0x0C, 0x00}},
    };
}

Bytes concat(const std::vector<Received>& packets) {
    Bytes stream;
    for (const auto& p : packets) {
        Bytes one = h4(p.type, p.bytes);
        stream.insert(stream.end(), one.begin(), one.end());
    }
    return stream;
}

void expectSame(const std::vector<Received>& want, const std::vector<Received>& got, const std::string& how) {
    ASSERT_EQ(want.size(), got.size()) << how;
    for (size_t i = 0; i < want.size(); ++i) {
        EXPECT_EQ(want[i].type, got[i].type) << how << " packet " << i;
        EXPECT_EQ(want[i].bytes, got[i].bytes) << how << " packet " << i;
    }
}

TEST_F(H4StreamTest, ReassemblesStreamSplitAtEveryOffset) {
    std::vector<Received> want = samplePackets();
    Bytes stream = concat(want);
    for (size_t cut = 0; cut <= stream.size(); ++cut) {
        parser.reset();
        out.clear();
        ASSERT_TRUE(feedCuts(stream, {cut}));
        expectSame(want, out, "cut at " + std::to_string(cut));
        EXPECT_EQ(0u, parser.pending());
    }
}

TEST_F(H4StreamTest, ReassemblesOneByteSlices) {
    std::vector<Received> want = samplePackets();
    Bytes stream = concat(want);
    std::vector<size_t> cuts;
    for (size_t i = 1; i < stream.size(); ++i) cuts.push_back(i);
    ASSERT_TRUE(feedCuts(stream, cuts));
    expectSame(want, out, "1-byte slices");
}

TEST_F(H4StreamTest, HoldsBackAnUnfinishedPacket) {
    Bytes stream = {0x04, 0x0E, 0x04, 0x01, 0x03};
    ASSERT_TRUE(feedCuts(stream, {}));
    EXPECT_TRUE(out.empty());
    EXPECT_EQ(5u, parser.pending());
    Bytes rest = {0x0C, 0x00};
    ASSERT_TRUE(feedCuts(rest, {}));
    ASSERT_EQ(1u, out.size());
    EXPECT_EQ((Bytes{0x0E, 0x04, 0x01, 0x03, 0x0C, 0x00}), out[0].bytes);
}

TEST_F(H4StreamTest, RejectsUnknownTypeAfterWholePackets) {
    for (uint8_t bad : {0x00, 0x05, 0xFF}) {
        parser.reset();
        out.clear();
        Bytes stream = {0x04, 0x13, 0x00, bad, 0x04, 0x13, 0x00};
        EXPECT_FALSE(feedCuts(stream, {}));
        EXPECT_EQ(bad, parser.badType());
        EXPECT_EQ(1u, out.size()) << "packets before the bad byte still count";
    }
}

}  // namespace
