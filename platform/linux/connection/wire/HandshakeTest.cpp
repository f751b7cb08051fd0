#include "platform/linux/connection/wire/Handshake.h"

#include <gtest/gtest.h>

#include "platform/linux/connection/wire/testdata/TestFrames.h"

namespace halvox::platform::linux_::dbus {
namespace {

using State = HandshakeState;

constexpr std::string_view kGuid = "0123456789abcdef0123456789abcdef";
constexpr uid_t kUid = 1000;  // 31303030 in hexadecimal
const std::string kNul(1, '\0');
const std::string kOk = "OK " + std::string(kGuid) + "\r\n";
const std::string kRejected = "REJECTED EXTERNAL ANONYMOUS\r\n";

// The result of one conversation.
struct Outcome {
  State state = State::kContinue;
  std::string output;
  std::size_t consumed = 0;
  std::string error;
};

// Feeds the input in pieces of that size until the handshake is over.
Outcome converse(std::string_view input, std::size_t pieceSize = SIZE_MAX) {
  ServerHandshake server{std::string(kGuid), kUid};
  Outcome outcome;
  while (outcome.consumed < input.size() && outcome.state == State::kContinue) {
    const auto progress =
        server.feed(asBytes(input.substr(outcome.consumed, pieceSize)), outcome.output);
    outcome.state = progress.state;
    outcome.error = progress.error;
    outcome.consumed += progress.consumedBytes;
  }
  return outcome;
}

// Returns what a client sends: a NUL, then each text as a line.
std::string lines(std::initializer_list<std::string_view> texts) {
  std::string input = kNul;
  for (const std::string_view text : texts) input.append(text).append("\r\n");
  return input;
}

TEST(ServerHandshakeTest, ExternalWithTheUidOfTheSocketIsAccepted) {
  const Outcome outcome = converse(kNul + "AUTH EXTERNAL 31303030\r\nBEGIN\r\n");

  EXPECT_EQ(outcome.state, State::kDone);
  EXPECT_EQ(outcome.output, kOk);
}

TEST(ServerHandshakeTest, ExternalWithoutAnIdentityAsksForIt) {
  for (const char* data : {"DATA", "DATA ", "DATA 31303030"}) {
    const Outcome outcome = converse(kNul + "AUTH EXTERNAL\r\n" + data + "\r\nBEGIN\r\n");

    EXPECT_EQ(outcome.state, State::kDone) << data;
    EXPECT_EQ(outcome.output, "DATA\r\n" + kOk) << data;
  }
}

TEST(ServerHandshakeTest, AnyOtherIdentityIsRejected) {
  for (const char* claim : {"30", "313030", "3130303030", "xyz", "3", "2b31303030", "0031303030"}) {
    EXPECT_EQ(converse(kNul + "AUTH EXTERNAL " + claim + "\r\n").output, kRejected) << claim;
    EXPECT_EQ(converse(kNul + "AUTH EXTERNAL\r\nDATA " + claim + "\r\n").output,
              "DATA\r\n" + kRejected)
        << claim;
  }
}

TEST(ServerHandshakeTest, AnonymousIsAcceptedWithAndWithoutATrace) {
  for (const char* trace : {"", " 616e6f6e", " "}) {
    const Outcome outcome = converse(kNul + "AUTH ANONYMOUS" + trace + "\r\nBEGIN\r\n");
    EXPECT_EQ(outcome.state, State::kDone) << trace;
    EXPECT_EQ(outcome.output, kOk);
  }
  EXPECT_EQ(converse(kNul + "AUTH ANONYMOUS trace\r\n").output, kRejected);
}

TEST(ServerHandshakeTest, BareAndUnknownMechanismsGetTheListAndMayGoOn) {
  const Outcome outcome =
      converse(kNul + "AUTH\r\nAUTH DBUS_COOKIE_SHA1 31\r\nAUTH ANONYMOUS\r\nBEGIN\r\n");

  EXPECT_EQ(outcome.state, State::kDone);
  EXPECT_EQ(outcome.output, kRejected + kRejected + kOk);
}

TEST(ServerHandshakeTest, FileDescriptorsAreNotTaken) {
  const Outcome outcome = converse(kNul + "AUTH ANONYMOUS\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n");

  EXPECT_EQ(outcome.state, State::kDone);
  EXPECT_EQ(outcome.output, kOk + "ERROR file descriptors are not taken\r\n");
}

TEST(ServerHandshakeTest, BytesOfTheFirstMessageAreLeft) {
  const std::string handshake = kNul + "AUTH EXTERNAL\r\nDATA\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n";
  const std::string input = handshake + std::string("l\1\0\1\r\nBEGIN\r\n", 13);

  for (const std::size_t pieceSize : {std::size_t{1}, std::size_t{3}, input.size()}) {
    const Outcome outcome = converse(input, pieceSize);

    EXPECT_EQ(outcome.state, State::kDone);
    EXPECT_EQ(outcome.consumed, handshake.size()) << pieceSize;
  }
}

TEST(ServerHandshakeTest, PiecesOfAnySizeGiveTheSameAnswers) {
  const std::string input =
      kNul +
      "AUTH\r\nAUTH EXTERNAL 30\r\nHELLO\r\nAUTH EXTERNAL\r\nCANCEL\r\nAUTH EXTERNAL "
      "31303030\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n";
  const Outcome whole = converse(input);
  EXPECT_EQ(whole.state, State::kDone);

  for (std::size_t pieceSize = 1; pieceSize < input.size(); ++pieceSize) {
    EXPECT_EQ(converse(input, pieceSize).output, whole.output) << pieceSize;
  }
}

TEST(ServerHandshakeTest, CancelAndErrorGoBackToTheStart) {
  for (const char* line : {"CANCEL", "ERROR", "ERROR with a reason"}) {
    EXPECT_EQ(converse(lines({"AUTH EXTERNAL", line})).output, "DATA\r\n" + kRejected);
    EXPECT_EQ(converse(lines({"AUTH ANONYMOUS", line})).output, kOk + kRejected);
    EXPECT_EQ(converse(lines({"AUTH ANONYMOUS", line, "BEGIN"})).state, State::kFailed);
    EXPECT_EQ(converse(lines({"AUTH ANONYMOUS", line, "AUTH ANONYMOUS", "BEGIN"})).state,
              State::kDone);
  }
}

TEST(ServerHandshakeTest, UnknownCommandsGetAnError) {
  for (const char* line : {"HELLO", "", "auth EXTERNAL", " AUTH", "AUTH\tEXTERNAL", "DATA 31",
                           "NEGOTIATE_UNIX_FD", "\x80", "AUTH EXTERNAL\nBEGIN", "CANCEL"}) {
    const Outcome outcome = converse(kNul + line + "\r\n");

    EXPECT_EQ(outcome.state, State::kContinue) << line;
    EXPECT_TRUE(outcome.output.starts_with("ERROR")) << line;
    EXPECT_TRUE(outcome.output.ends_with("\r\n")) << line;
  }
}

TEST(ServerHandshakeTest, FirstByteMustBeNul) {
  const Outcome outcome = converse("AUTH EXTERNAL 31303030\r\nBEGIN\r\n");

  EXPECT_EQ(outcome.state, State::kFailed);
  EXPECT_EQ(outcome.error, "the first byte is not NUL");
  EXPECT_EQ(outcome.output, "");
}

TEST(ServerHandshakeTest, BeginBeforeTheAuthenticationFails) {
  EXPECT_EQ(converse(kNul + "BEGIN\r\n").state, State::kFailed);
  EXPECT_EQ(converse(kNul + "AUTH EXTERNAL\r\nBEGIN\r\n").state, State::kFailed);
  EXPECT_EQ(converse(kNul + "AUTH EXTERNAL 30\r\nBEGIN\r\n").state, State::kFailed);
}

TEST(ServerHandshakeTest, LinesHaveALimitHoweverTheyCome) {
  const std::string atLimit(kMaxHandshakeLine - 2, 'x');

  EXPECT_EQ(converse(kNul + atLimit + "\r\n").state, State::kContinue);
  EXPECT_EQ(converse(kNul + atLimit + "x\r\n").state, State::kFailed);
  EXPECT_EQ(converse(kNul + std::string(1'000'000, 'x'), 1000).state, State::kFailed);
}

TEST(ServerHandshakeTest, AttemptsHaveALimit) {
  std::string input = kNul;
  for (unsigned line = 0; line < kMaxRefusedLines; ++line) input += "AUTH EXTERNAL 30\r\n";

  EXPECT_EQ(converse(input).state, State::kContinue);
  EXPECT_EQ(converse(input + "AUTH ANONYMOUS\r\nBEGIN\r\n").state, State::kDone);
  EXPECT_EQ(converse(input + "HELLO\r\n").state, State::kFailed);
}

TEST(ServerHandshakeTest, NothingIsTakenAfterTheEnd) {
  ServerHandshake server{std::string(kGuid), kUid};
  std::string output;
  ASSERT_EQ(server.feed(asBytes(kNul + "AUTH ANONYMOUS\r\nBEGIN\r\n"), output).state, State::kDone);

  const auto progress = server.feed(asBytes("AUTH\r\n"), output);

  EXPECT_EQ(progress.state, State::kDone);
  EXPECT_EQ(progress.consumedBytes, 0U);
  EXPECT_EQ(output, kOk);
}

TEST(ClientHandshakeTest, BeginsAfterTheServerAgreed) {
  ClientHandshake client(kUid);
  std::string output;

  client.start(output);
  EXPECT_EQ(output, kNul + "AUTH EXTERNAL 31303030\r\n");
  const auto progress = client.feed(asBytes(kOk), output);

  EXPECT_EQ(progress.state, State::kDone);
  EXPECT_EQ(progress.consumedBytes, kOk.size());
  EXPECT_EQ(output, kNul + "AUTH EXTERNAL 31303030\r\nBEGIN\r\n");
  EXPECT_EQ(client.serverGuid(), kGuid);
}

TEST(ClientHandshakeTest, AnswersInPiecesAreTaken) {
  ClientHandshake client(kUid);
  std::string output;
  auto state = State::kContinue;

  for (const char byte : kOk) {
    EXPECT_EQ(state, State::kContinue);
    state = client.feed(asBytes({&byte, 1}), output).state;
  }

  EXPECT_EQ(state, State::kDone);
}

TEST(ClientHandshakeTest, AnyOtherAnswerFails) {
  const std::string tooLong(kMaxHandshakeLine + 1, 'x');
  for (const std::string& answer :
       {kRejected, std::string("OK\r\n"), std::string("OK 12\r\n"), std::string("ERROR\r\n"),
        std::string("\xff\r\n"), "OK " + std::string(32, 'x') + "\r\n", tooLong}) {
    ClientHandshake client(kUid);
    std::string output;

    const auto progress = client.feed(asBytes(answer), output);

    EXPECT_EQ(progress.state, State::kFailed) << answer.substr(0, 50);
    EXPECT_NE(progress.error, "");
    EXPECT_EQ(output, "");
  }
}

TEST(ClientHandshakeTest, ClientAndServerUnderstandEachOther) {
  ClientHandshake client(kUid);
  ServerHandshake server{std::string(kGuid), kUid};
  std::string toServer;
  std::string toClient;

  client.start(toServer);
  EXPECT_EQ(server.feed(asBytes(toServer), toClient).state, State::kContinue);
  toServer.clear();
  EXPECT_EQ(client.feed(asBytes(toClient), toServer).state, State::kDone);
  EXPECT_EQ(server.feed(asBytes(toServer), toClient).state, State::kDone);
}

}  // namespace
}  // namespace halvox::platform::linux_::dbus
