#include "keystrand/RequestHandler.h"

#include "tests/keystrand/KernelFixture.h"

namespace keystrand::test {

namespace {

const std::string kPath = "IOService:/IOResources/Keystrand";

/// A kernel side that can do without its entry and hide a property.
class SparseHandler : public RequestHandler {
  public:
    using RequestHandler::RequestHandler;
    bool entry = true;
    std::string hidden;

  protected:
    [[nodiscard]] bool hasEntry() const override { return entry; }
    [[nodiscard]] bool hidesProperty(std::string_view name) override { return name == hidden; }
};

class RequestHandlerTest : public KernelFixture {
  protected:
    [[nodiscard]] ByteVector ask(std::uint8_t operation, const ByteVector& body) {
        const RequestOutcome outcome = handler_.handle(request(operation, 7, body), connection_);
        EXPECT_EQ(outcome.kind, RequestOutcome::Kind::reply);
        return outcome.packet;
    }
    void expectAnswer(std::uint8_t operation, const ByteVector& body, KernelStatus status,
                      std::uint32_t reported = 0, const ByteVector& answer = {}) {
        EXPECT_EQ(ask(operation, body), reply(operation, 7, status, reported, answer));
    }
    void expectHangUp(const ByteVector& packet) {
        const RequestOutcome outcome = handler_.handle(packet, connection_);
        EXPECT_EQ(outcome.kind, RequestOutcome::Kind::hangUp);
        EXPECT_TRUE(outcome.packet.empty());
    }
    void open() { expectAnswer(4, Bytes().u32(0).text(kPath), 0); }

    static ByteVector property(const std::string& path, const std::string& name) {
        return Bytes().u16(path.size()).text(path).text(name);
    }
    static ByteVector call(std::uint32_t selector, std::uint32_t offered, const ByteVector& input) {
        return Bytes().u32(selector).u32(offered).bytes(input);
    }

    SparseHandler handler_{RequestHandler::Parts{
        .registry = kernel_.registry, .commands = commands_, .logLevel = kernel_.logLevel}};
    ConnectionState connection_;
};

TEST_F(RequestHandlerTest, WhatIsNoRequestEndsTheConnection) {
    const ByteVector good = request(2, 7, Bytes().text("Keystrand"));
    for (std::size_t length = 0; length < 16; ++length) {
        expectHangUp({good.begin(), good.begin() + static_cast<std::ptrdiff_t>(length)});
    }
    expectHangUp(request(0, 7, {}));
    expectHangUp(request(7, 7, {}));
    ByteVector reserved = good;
    reserved[6] = 1;
    expectHangUp(reserved);
    open();
    const ByteVector largest(wire::kKernelMessageMaxSize - 16);
    expectAnswer(5, largest, kKernelMalformedFrame);
    ByteVector larger = largest;
    larger.push_back(0);
    expectHangUp(request(5, 7, larger));
}

TEST_F(RequestHandlerTest, EntryIsFoundByItsPathAndByItsClass) {
    const ByteVector path = Bytes().text(kPath);
    expectAnswer(1, path, 0, 1, path);
    expectAnswer(1, Bytes().text("elsewhere"), 0);
    expectAnswer(1, {}, kKernelMalformedRequest);
    expectAnswer(2, Bytes().text("Keystrand"), 0, 1, path);
    expectAnswer(2, Bytes().text("keystrand"), 0);
    expectAnswer(2, {}, kKernelMalformedRequest);
    handler_.entry = false;
    expectAnswer(1, path, 0);
    expectAnswer(2, Bytes().text("Keystrand"), 0);
    expectAnswer(3, property(kPath, "P"), kKernelNoSuchEntry);
}

TEST_F(RequestHandlerTest, PropertiesOfTheEntry) {
    ASSERT_TRUE(kernel_.registry.set("P", ByteVector{1, 2}));
    ASSERT_TRUE(kernel_.registry.set("empty", {}));
    expectAnswer(3, property(kPath, "P"), 0, 1, {1, 2});
    expectAnswer(3, property(kPath, "empty"), 0, 1);
    expectAnswer(3, property(kPath, "none"), 0);
    expectAnswer(3, property("elsewhere", "P"), kKernelNoSuchEntry);
    expectAnswer(3, property(kPath, ""), kKernelMalformedRequest);
    handler_.hidden = "P";
    expectAnswer(3, property(kPath, "P"), 0);
}

TEST_F(RequestHandlerTest, CallsNeedAConnectionThatWasOpened) {
    const ByteVector get = call(0, 64, frame(25, Bytes().u32(9)));
    const ByteVector level = Bytes().u32(2).u32(1).u32(0);
    expectAnswer(5, get, kKernelNotOpen);
    expectAnswer(6, level, kKernelNotOpen);
    expectAnswer(4, Bytes().u32(0).text("elsewhere"), kKernelNoSuchEntry);
    expectAnswer(4, Bytes().u32(1).text(kPath), kKernelUnknownSelector);
    expectAnswer(4, Bytes().u32(0), kKernelMalformedRequest);
    expectAnswer(5, get, kKernelNotOpen);
    open();
    expectAnswer(5, get, 0);
    expectAnswer(6, level, 0, 1, Bytes().u64(40));
}

TEST_F(RequestHandlerTest, StructCalls) {
    open();
    expectAnswer(5, Bytes().u32(0).u16(0), kKernelMalformedRequest);
    expectAnswer(5, call(1, 64, frame(25, Bytes().u32(9))), kKernelUnknownSelector);
    expectAnswer(5, call(0, 64, Bytes().text("DRCX").u32(25)), kKernelMalformedFrame);
    expectAnswer(5, call(0, 64, frame(25, {})), kKernelBadPayload);
    expectAnswer(5, call(0, 0, frame(24, Bytes().u32(9).u8(5))), 0);
    expectAnswer(5, call(0, 0, frame(25, Bytes().u32(9))), kKernelReplyDoesNotFit);
    expectAnswer(5, call(0, 1, frame(25, Bytes().u32(9))), 0, 1, {5});
}

TEST_F(RequestHandlerTest, ScalarCalls) {
    open();
    expectAnswer(6, Bytes().u32(2).u32(1), kKernelMalformedRequest);
    expectAnswer(6, Bytes().u32(0).u32(1).u32(0), kKernelUnknownSelector);
    expectAnswer(6, Bytes().u32(2).u32(1).u32(1).u64(0), kKernelBadPayload);
    expectAnswer(6, Bytes().u32(2).u32(0).u32(0), kKernelReplyDoesNotFit);
    expectAnswer(6, Bytes().u32(2).u32(16).u32(0), 0, 1, Bytes().u64(40));
}

} // namespace

} // namespace keystrand::test
