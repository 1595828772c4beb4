// The files of a call: what they may not be, and how they are left.
#include <sys/stat.h>
#include <unistd.h>

#include "run.h"

namespace {

class KmtoolFiles : public sandbox {
 protected:
  KmtoolFiles() {
    expect_done({"device", "create"});
    expect_done({"generate", "aes", "--purpose", "encrypt,decrypt", "-o", "a"});
    expect_done({"generate", "hmac", "-o", "k"});
    write("m", "message");
    expect_done({"encrypt", "a", "-i", "m", "-o", "c"});
  }

  mode_t mode_of(const std::string& name) const {
    struct stat status {};
    stat(path(name).c_str(), &status);
    return status.st_mode & 07777;
  }
};

TEST_F(KmtoolFiles, AreTheOnlyOnesOfTheirKind) {
  const std::vector<failing_call> calls = {
      {{"generate", "hmac", "-o", ""}, "the path is empty"},
      {{"--device", "", "device", "show"}, "the path is empty"},
      {{"show", ""}, "the path is empty"},
      {{"sign", "-"}, "KEY and --input both want standard input"},
      {{"encrypt", "a", "--aad", "-", "-o", "x"}, "--input and --aad both want standard input"},
      {{"encrypt", "a", "-i", "m", "-o", "a"}, "KEY and --output are the same file"},
      {{"encrypt", "a", "-i", "m", "-o", "./m"}, "--input and --output are the same file"},
      {{"sign", "k", "-i", "m", "--token", "m", "-o", "m"}, "are the same file"},
      {{"--json", "encrypt", "a", "-i", "m"}, "both want standard output"},
      {{"--json", "export", "a", "-o", "-"}, "both want standard output"},
      {{"sign", "k", "-i", "m", "--mac", "1000"}, "a multiple of 8 up to 256"},
      {{"encrypt", "a", "-i", "m", "--mac", "136"}, "a multiple of 8 up to 128"},
      {{"attest", "k", "--challenge", std::string(258, '0')}, "129 bytes, and at most 128"},
  };
  expect_all(WRONG_USAGE, calls);
  EXPECT_EQ(read("m"), "message");
}

TEST_F(KmtoolFiles, KeepTheirModeOrAreTheUsersAlone) {
  expect_done({"decrypt", "a", "-i", "c", "-o", "p"});
  EXPECT_EQ(mode_of("p"), 0600u);
  chmod(path("p").c_str(), 0640);
  expect_done({"decrypt", "a", "-i", "c", "-o", "p"});
  EXPECT_EQ(mode_of("p"), 0640u);
  if (geteuid() != 0) GTEST_SKIP() << "only root has files of two owners";
  ASSERT_EQ(chown(path("p").c_str(), 1, 1), 0);
  expect_done({"decrypt", "a", "-i", "c", "-o", "p"});
  struct stat status {};
  stat(path("p").c_str(), &status);
  EXPECT_EQ(status.st_uid, 1u);
}

TEST_F(KmtoolFiles, LeaveNothingWhenASignalEndsTheTool) {
  const words before = files();
  for (const char* signal : {"INT", "TERM", "HUP"}) {
    // The input stays open until the tool has made its temporary file.
    const std::string line =
        "mkfifo .pipe; " + command({"decrypt", "a", "-i", ".pipe", "-o", "p"}) +
        " 2>.err & exec 3>.pipe; head -c 20 c >&3; "
        "for i in $(seq 200); do ls p.?????? >.ls 2>&1 && break; sleep 0.05; done; "
        "kill -" +
        signal + " $!; wait $!; code=$?; rm .pipe; [ -s .ls ] && exit $code";
    EXPECT_GT(shell(line), 128) << signal;
    EXPECT_EQ(files(), before) << signal;
  }
}

TEST_F(KmtoolFiles, AreNotTakenForClosedStreams) {
  EXPECT_EQ(shell(command({"sign", "k"}) + " <&- >.out 2>.err"), WRONG_USAGE);
  EXPECT_NE(read(".err").find("cannot read standard input"), std::string::npos);
  EXPECT_EQ(shell(command({"sign", "k", "-i", "m"}) + " >&- 2>.err"), WRONG_USAGE);
}

TEST_F(KmtoolFiles, GoToATerminalOnlyWhenAskedTo) {
  const std::string plain = command({"encrypt", "a", "-i", "m"});
  if (shell("script -qec true /dev/null >.out 2>&1") != 0) GTEST_SKIP() << "no script(1)";
  EXPECT_EQ(shell("script -qec \"" + plain + "\" /dev/null >.out 2>&1"), WRONG_USAGE);
  EXPECT_NE(read(".out").find("a terminal"), std::string::npos);
  EXPECT_EQ(shell("script -qec \"" + plain + " -o -\" /dev/null >.out 2>&1"), DONE);
}

TEST_F(KmtoolFiles, AnswerAVerificationInJsonToo) {
  const call_result result = run({"--json", "verify", "k", "-i", "m", "--signature", "c"});
  EXPECT_EQ(result.exit_code, REFUSED);
  EXPECT_EQ(json::parse(result.out)["verified"], false);
}

TEST_F(KmtoolFiles, ToldByTheToolItself) {
  EXPECT_TRUE(out_of({"--version"}).starts_with("kmtool "));
  EXPECT_EQ(out_of({"help", "device", "show"}), out_of({"device", "show", "--help"}));
  EXPECT_NE(out_of({"help", "tags"}).find("key_size"), std::string::npos);
  expect({"help", "shw"}, WRONG_USAGE, "Did you mean 'show'?");
}

// Keys of other tools that are not quite keys.
class KmtoolImport : public KmtoolFiles {
 protected:
  // An EC key of the openssl command, DER in PKCS #8, with the private value at 36 for P-256.
  void make_ec(const std::string& curve, const std::string& form = "DER") const {
    ASSERT_EQ(shell("openssl genpkey -algorithm EC -pkeyopt ec_paramgen_curve:" + curve +
                    " -outform " + form + " -out in 2>.err"),
              0);
  }
  void patch(size_t at, const std::string& bytes) const {
    std::string der = read("in");
    write("in", der.replace(at, bytes.size(), bytes));
  }
  void refuses(const char* algorithm, const std::string& message) const {
    expect({"import", algorithm, "in", "-o", "x"}, WRONG_USAGE, message);
  }
};

TEST_F(KmtoolImport, TakesSoundKeysOfItsCurvesAlone) {
  for (const char* curve : {"secp256k1", "brainpoolP256r1"}) {
    make_ec(curve);
    refuses("ec", std::string("on the curve ") + curve);
  }
  constexpr unsigned char ORDER[] = {0xFF, 0xFF, 0xFF, 0xFF, 0x00, 0x00, 0x00, 0x00,
                                     0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF,
                                     0xBC, 0xE6, 0xFA, 0xAD, 0xA7, 0x17, 0x9E, 0x84,
                                     0xF3, 0xB9, 0xCA, 0xC2, 0xFC, 0x63, 0x25, 0x51};
  for (const std::string& d : {std::string(32, '\0'), std::string(ORDER, ORDER + 32),
                               std::string(31, '\0') + "\1"}) {  // of another point
    make_ec("P-256");
    patch(36, d);
    refuses("ec", "");
  }
  make_ec("P-256");
  write("in", read("in") + "x");
  refuses("ec", "follow it");
  make_ec("P-256", "PEM");
  expect_done({"import", "ec", "in", "-o", "good"});
  write("in", read("in") + read("in"));
  refuses("ec", "more than one key");
  ASSERT_EQ(shell("openssl genrsa -primes 3 -out in 2048 2>.err"), 0);
  refuses("rsa", "more than two primes");
}

}  // namespace
