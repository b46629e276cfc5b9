#include "KSTLib/AllocatedBytes.h"
#include "base/Concat.h"
#include "kstctl/Forms.h"
#include "kstctl/commands/Inputs.h"
#include "kstctl/decode/Kinds.h"
#include "kstctl/decode/Payloads.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>
#include <map>
#include <set>
#include <string>

namespace kstctl::decode {
namespace {

platform::Bytes bytes(const std::string& digits) {
    return bytesOfHex(digits).value();
}

/// The examples of docs/wire-formats.md by their names.
std::map<std::string, platform::Bytes> examples() {
    std::map<std::string, platform::Bytes> found;
    std::ifstream document(SOURCE_ROOT "/docs/wire-formats.md");
    std::string name;
    std::string digits;
    for (std::string line; std::getline(document, line);) {
        if (line.rfind("```bytes ", 0) == 0) {
            name = line.substr(9);
            digits.clear();
        } else if (line == "```" && !name.empty()) {
            found[name] = bytes(digits);
            name.clear();
        } else {
            digits += line + '\n';
        }
    }
    return found;
}

Decoder decoderOf(const std::string& kind) {
    const Kind* const found = findKind(kind);
    return found != nullptr ? found->decode : findCommand(kind)->decode;
}

std::string fieldsOf(const Result& result) {
    if (!result) {
        return result.error().description;
    }
    std::string text = JSONForm(result.value().fields);
    text.pop_back();
    return text;
}

std::string decoded(const std::string& kind, const platform::Bytes& input,
                    Secrets secrets = Secrets::hidden) {
    const Result result = decoderOf(kind)(input, secrets);
    if (result) {
        EXPECT_EQ(result.value().size, input.size());
    } else {
        EXPECT_EQ(statusOf(result.error()), ExitStatus::malformed);
    }
    return fieldsOf(result);
}

std::string decoded(const std::string& kind, const std::string& digits) {
    return decoded(kind, bytes(digits));
}

const std::string kHandle = R"("handle":"a0a1a2a3a4a5a6a7a8a9aaabacadaeaf")";
const std::string kMarker = R"({"type":4,"typeText":"marker","word4":1,"word8":0,)"
                            R"("userId":4294967295,"userIdText":"no user","word16":0,"word24":0,)"
                            R"("dataLength":0})";
const std::string kPassphrase =
    R"({"type":2,"typeText":"passphrase entered","word4":1,"word8":0,"userId":1000,"word16":0,)"
    R"("word24":0,"dataLength":136,"purpose":1,"passphraseLength":11,)";
const std::string kHidden =
    kPassphrase + R"("passphrase":null,"passphraseUnknown":"hidden; --show-secrets shows it"})";
const std::string kLeaf = R"({"type":2,"typeText":"passphrase entered","state":0,"priority":0,)"
                          R"("dataLength":4,"property200":1,"data":"01000000"})";

struct Example {
    std::string name;
    std::string kind;
    std::string fields;
};

const Example kExamples[] = {
    {"frame", "frame",
     R"({"command":25,"commandText":"get-environment-variable","secondByte":0,"thirdByte":0,)"
     R"("unusedByte":0,"payload":{"variable":7}})"},
    {"frame-add-credential", "frame",
     R"({"command":5,"commandText":"add-credential","secondByte":0,"thirdByte":0,"unusedByte":0,)"
     R"("payload":{)" +
         kHandle + R"(,"credential":)" + kMarker + R"(,"scope":1,"scopeText":"context"}})"},
    {"credential-marker", "credential", kMarker},
    {"credential-passphrase", "credential", kHidden},
    {"credential-list", "credential-list",
     R"({"count":2,"credentials":[)" + kMarker +
         R"(,{"type":12,"typeText":"kext deny list","word4":1,"word8":0,"userId":4294967295,)"
         R"("userIdText":"no user","word16":0,"word24":0,"dataLength":8,"format":1,)"
         R"("revision":7}]})"},
    {"requirement-leaf", "requirement", kLeaf},
    {"requirement-tree", "requirement",
     R"({"type":4,"typeText":"all of","state":0,"priority":0,"dataLength":20,"children":[)"
     R"({"type":1,"typeText":"passcode validated","state":0,"priority":0,"dataLength":4,)"
     R"("property100":0,"data":"00000000"},{"type":7,"typeText":"k of n","state":0,"priority":0,)"
     R"("dataLength":24,"property700":1,"children":[)" +
         kLeaf + R"(,{"type":6,"state":0,"priority":0,"dataLength":0,"data":""}]}]})"},
    {"verify-policy", "verify-policy",
     "{" + kHandle +
         R"(,"policy":"unlock","preflight":true,"maxGlobalCredentialAge":300,"parameters":[)"
         R"({"type":1,"length":4,"value":-1,"valueText":"number"},)"
         R"({"type":3,"length":3,"value":"757362"}]})"},
    {"verify-acl-constraint", "verify-acl-constraint",
     "{" + kHandle +
         R"(,"constraint":"0102030405","preflight":false,"maxGlobalCredentialAge":4294967295,)"
         R"("maxGlobalCredentialAgeText":"any age","parameters":[]})"},
    {"process-acl", "parse-acl",
     R"({"handle":"00000000000000000000000000000000","acl":"300102","operation":"7369676e",)"
     R"("maxGlobalCredentialAge":0,"parameters":[{"type":4,"length":4,"value":1000,)"
     R"("valueText":"user"}]})"},
    {"add-credential", "add-credential",
     "{" + kHandle + R"(,"credential":)" + kHidden + R"(,"scope":1,"scopeText":"context"})"},
    {"remove-credential", "remove-credentials-by-value",
     R"({"handle":"00000000000000000000000000000000","credential":)" + kMarker +
         R"(,"scope":2,"scopeText":"global"})"},
    {"remove-credentials-by-type", "remove-credentials-by-type",
     "{" + kHandle +
         R"(,"type":2,"typeText":"passphrase entered","scope":1,"scopeText":"context"})"},
    {"contains-passphrase", "contains-passphrase", "{" + kHandle + R"(,"purpose":1,"argument":0})"},
    {"context-property", "context-property", "{" + kHandle + R"(,"property":3})"},
    {"set-environment-variable", "set-environment-variable", R"({"variable":7,"value":"c0ffee"})"},
    {"get-environment-variable", "get-environment-variable", R"({"variable":7})"},
    {"kernel-control", "kernel-control",
     R"({"control":5,"controlText":"set allowed","restrictedModeAllowed":1})"},
};

TEST(DecodeTest, EveryExampleOfTheDocuments) {
    const auto all = examples();
    for (const Example& example : kExamples) {
        SCOPED_TRACE(example.name);
        ASSERT_TRUE(all.contains(example.name));
        EXPECT_EQ(decoded(example.kind, all.at(example.name)), example.fields);
    }
    EXPECT_EQ(gAllocatedBytes, 0);
}

TEST(DecodeTest, EveryExampleCutShort) {
    const auto all = examples();
    for (const Example& example : kExamples) {
        SCOPED_TRACE(example.name);
        const platform::Bytes& whole = all.at(example.name);
        for (std::size_t size = 0; size < whole.size(); ++size) {
            const Result result = decoderOf(example.kind)(Bytes(whole).first(size), Secrets::shown);
            // The value of a variable may be of any length.
            if (example.name != "set-environment-variable" || size < 4) {
                ASSERT_FALSE(result) << size;
                EXPECT_EQ(statusOf(result.error()), ExitStatus::malformed);
            }
        }
    }
    EXPECT_EQ(gAllocatedBytes, 0);
}

TEST(DecodeTest, WhatFollowsIsCountedOnly) {
    const auto all = examples();
    for (const char* const name :
         {"frame", "credential-marker", "credential-list", "requirement-tree", "verify-policy",
          "verify-acl-constraint", "process-acl", "add-credential", "contains-passphrase"}) {
        SCOPED_TRACE(name);
        const Example& example =
            *std::find_if(std::begin(kExamples), std::end(kExamples),
                          [name](const Example& candidate) { return candidate.name == name; });
        platform::Bytes longer = all.at(name);
        longer.insert(longer.end(), 3, 0xee);
        const Result result = decoderOf(example.kind)(longer, Secrets::hidden);
        EXPECT_EQ(fieldsOf(result), example.fields);
        EXPECT_EQ(result.value().size, longer.size() - 3);
    }
}

TEST(DecodeTest, PassphraseIsShownOnlyWhenAskedFor) {
    const auto all = examples();
    const std::string digits = "6f70656e20736573616d65";
    for (const auto& [name, kind] :
         {std::pair<const char*, const char*>{"credential-passphrase", "credential"},
          {"add-credential", "add-credential"}}) {
        EXPECT_EQ(decoded(kind, all.at(name)).find(digits), std::string::npos);
        EXPECT_NE(
            decoded(kind, all.at(name), Secrets::shown).find("\"passphrase\":\"" + digits + "\""),
            std::string::npos);
    }
    // In a frame, whether its command can be understood or not.
    platform::Bytes frame = bytes("4452435305000000");
    frame.insert(frame.end(), all.at("add-credential").begin(), all.at("add-credential").end());
    EXPECT_EQ(decoded("frame", frame).find(digits), std::string::npos);
    frame[4] = 7;
    EXPECT_EQ(decoded("frame", frame),
              R"({"command":7,"secondByte":0,"thirdByte":0,"unusedByte":0,"payload":{"size":188,)"
              R"("bytes":null,"bytesUnknown":"hidden; --show-secrets shows them"}})");
    EXPECT_NE(decoded("frame", frame, Secrets::shown).find(digits), std::string::npos);
    frame[4] = 3;
    EXPECT_EQ(fieldsOf(findKind("frame")->decode(frame, Secrets::hidden)).find(digits),
              std::string::npos);
}

TEST(DecodeTest, PassphraseOfAnyStoredLengthEndsWithItsArea) {
    platform::Bytes credential = examples().at("credential-passphrase");
    for (const auto& [stored, shown] :
         {std::pair<std::uint8_t, std::size_t>{0, 0}, {127, 127}, {128, 128}, {129, 128}}) {
        credential[36] = stored;
        const std::string text = decoded("credential", credential, Secrets::shown);
        const std::size_t start = text.find("\"passphrase\":\"") + 14;
        EXPECT_EQ(text.find('"', start) - start, 2 * shown);
        EXPECT_NE(text.find(base::concat("\"passphraseLength\":", stored, ',')), std::string::npos);
    }
}

TEST(DecodeTest, FieldsOfEveryTypeOfCredential) {
    const std::pair<std::string, std::string> kTypes[] = {
        {"01:1c", R"("property101":50462976,"property102":117835012,"dataWord8":"08090a0b",)"
                  R"("property100":"0c0d0e0f101112131415161718191a1b")"},
        {"03:58",
         R"("property101":50462976,"property300":"0405060708090a0b0c0d0e0f10111213",)"
         R"("property302":"1415161718191a1b1c1d1e1f20212223",)"
         R"("property301":"2425262728292a2b2c2d2e2f303132333435363738393a3b3c3d3e3f40414243",)"
         R"("dataWord68":"44454647","property100":"48494a4b4c4d4e4f5051525354555657")"},
        {"07:38",
         R"("property400":"000102030405060708090a0b0c0d0e0f101112131415161718191a1b1c1d1e1f",)"
         R"("property401":"202122232425262728292a2b2c2d2e2f3031323334353637")"},
        {"09:18", R"("property101":50462976,"dataWord4":"04050607",)"
                  R"("property100":"08090a0b0c0d0e0f1011121314151617")"},
        {"0a:24", R"("property101":50462976,"property501":"0405060708090a0b0c0d0e0f10111213",)"
                  R"("property502":"1415161718191a1b1c1d1e1f20212223")"},
        {"0c:08", R"("format":50462976,"revision":117835012)"},
    };
    for (const auto& [typeAndLength, fields] : kTypes) {
        SCOPED_TRACE(typeAndLength);
        platform::Bytes credential(32);
        credential[0] = bytes(typeAndLength.substr(0, 2))[0];
        credential[28] = bytes(typeAndLength.substr(3))[0];
        for (std::uint8_t i = 0; i < credential[28]; ++i) {
            credential.push_back(i);
        }
        const std::string text = decoded("credential", credential);
        EXPECT_NE(text.find(base::concat("\"dataLength\":", credential[28], ",", fields, "}")),
                  std::string::npos)
            << text;
    }
}

TEST(DecodeTest, RecordsOfEveryType) {
    const std::pair<std::string, std::string> kRecords[] = {
        {"01000000 00f1536500000000 02000000 10e0536500000000 01 0000000000000000000000",
         R"({"type":1,"typeText":"timer restarted","alarmTimestamp":1700000000,)"
         R"("alarmTimestampText":"2023-11-14T22:13:20Z","version":2,)"
         R"("standardModeStartTimestamp":1699995664,)"
         R"("standardModeStartTimestampText":"2023-11-14T21:01:04Z","lockedInRestrictedMode":1})"},
        {"01000000 ffffffffffffffff 01000000 0000000000000000 ff 0000000000000000000000",
         R"({"type":1,"typeText":"timer restarted","alarmTimestamp":18446744073709551615,)"
         R"("version":1,"standardModeStartTimestamp":0,"lockedInRestrictedMode":255})"},
        {"02000000 80510100 100e0000 00000000 01 02 03 04 00000000000000000000000000000000",
         R"({"type":2,"typeText":"analytics collected","eventPeriodDuration":86400,)"
         R"("restrictedModeDuration":3600,"restrictedMode":1,"policyDisabledByPasscodeNotSet":2,)"
         R"("policyDisabledByBootArg":3,"policyDisabledByQuorvane":4})"},
        {"03000000 00f1536500000000 07000000 08000000 0000000000000000 01000000 00000000",
         R"({"type":3,"typeText":"save analytics","layout":"keystrand-sim","periodStart":1700000000,)"
         R"("periodStartText":"2023-11-14T22:13:20Z","restrictedInPeriod":7,"totalRestricted":8,)"
         R"("restrictedSince":0})"},
        {"04000000 100e0000 00000000000000000000000000000000000000000000000000000000",
         R"({"type":4,"typeText":"timer restarted, analytics collected",)"
         R"("totalRestrictedModeDuration":3600})"},
        {"63000000 100e0000 00000000000000000000000000000000000000000000000000000000",
         "there is no notification record of type 99"},
        {"00000000 100e0000 00000000000000000000000000000000000000000000000000000000",
         "there is no notification record of type 0"},
        {"04000000 100e0000 000000000000000000000000000000000000000000000000000000",
         "a notification record has 36 bytes, not 35"},
        {"04000000 100e0000 0000000000000000000000000000000000000000000000000000000000",
         "a notification record has 36 bytes, not 37"},
        {"", "a notification record has 36 bytes, not 0"},
    };
    for (const auto& [digits, fields] : kRecords) {
        EXPECT_EQ(decoded("record", digits), fields);
    }
}

TEST(DecodeTest, FilesOfTheDaemon) {
    const std::string state = "01000000 10e0536500000000 01";
    EXPECT_EQ(
        decoded("state", state),
        R"({"version":1,"standardModeStartTimestamp":1699995664,)"
        R"("standardModeStartTimestampText":"2023-11-14T21:01:04Z","lockedInRestrictedMode":1})");
    EXPECT_EQ(fieldsOf(decoderOf("state")(bytes("010000001000000000000000"), Secrets::hidden)),
              "a state file has at least 13 bytes, not 12");
    const Result longer = decoderOf("state")(bytes(state + "ffff"), Secrets::hidden);
    EXPECT_EQ(longer.value().size, 13U);

    const std::string figures = "00f1536500000000 07000000 08000000 00f1536500000000 01000000 ";
    EXPECT_EQ(decoded("analytics", figures + "00000000"),
              R"({"layout":"keystrand-sim","periodStart":1700000000,)"
              R"("periodStartText":"2023-11-14T22:13:20Z","restrictedInPeriod":7,)"
              R"("totalRestricted":8,"restrictedSince":1700000000,)"
              R"("restrictedSinceText":"2023-11-14T22:13:20Z"})");
    EXPECT_EQ(decoded("analytics", figures + "01000000"),
              R"({"layout":"opaque","bytes":")"
              R"(00f1536500000000070000000800000000f15365000000000100000001000000"})");
    EXPECT_EQ(fieldsOf(decoderOf("analytics")(platform::Bytes(31), Secrets::hidden)),
              "an analytics file has at least 32 bytes, not 31");
}

TEST(DecodeTest, Events) {
    EXPECT_EQ(decoded("event", "4b535445 01 01 0100 02000000 61 62 c0de"),
              R"({"stream":"a","name":"b","payload":"c0de"})");
    EXPECT_EQ(decoded("event", "4b535445 01 0f 0100 08000000 636f6d2e7a657276612e616c61726d 62 "
                               "00002a36fe9c9717"),
              R"({"stream":"com.zerva.alarm","name":"b","payload":"00002a36fe9c9717",)"
              R"("date":1700000000000000000,"dateText":"2023-11-14T22:13:20Z"})");
    EXPECT_EQ(decoded("event", "4b535445 01 0f 0100 07000000 636f6d2e7a657276612e616c61726d 62 "
                               "00002a36fe9c97"),
              R"({"stream":"com.zerva.alarm","name":"b","payload":"00002a36fe9c97"})");
    for (const char* const wrong :
         {"", "4b535445", "4b535445 02 01 0100 00000000 61 62",
          "4b535445 01 01 0100 00000000 61 00", "4b535445 01 01 0100 00000000 61 62 63",
          "4b535446 01 01 0100 00000000 61 62"}) {
        EXPECT_EQ(decoded("event", wrong), "not a well-formed event datagram");
    }
}

TEST(DecodeTest, KernelControls) {
    const std::string name = "4b5354524d54696d6572526573746172746564";
    const std::pair<std::string, std::string> kControls[] = {
        {"03000000 01 0000 02000000 10e0536500000000 01",
         R"({"control":3,"controlText":"daemon started","restrictedModeAllowed":1,)"
         R"("reserved":"0000","version":2,"standardModeStartTimestamp":1699995664,)"
         R"("standardModeStartTimestampText":"2023-11-14T21:01:04Z","lockedInRestrictedMode":1})"},
        {"03000000 01", "the input of control code 3 has 16 bytes, not 1"},
        {"05000000 ff", R"({"control":5,"controlText":"set allowed","restrictedModeAllowed":255})"},
        {"05000000", "the input of control code 5 has 1 bytes, not 0"},
        {"06000000" + std::string(64, '0'),
         R"({"control":6,"controlText":"restore analytics","layout":"opaque","bytes":")" +
             std::string(64, '0') + "\"}"},
        {"07000000" + name + std::string(128 - name.size(), '0'),
         R"({"control":7,"controlText":"acknowledge a notification",)"
         R"("property":"KSTRMTimerRestarted"})"},
        {"07000000" + std::string(128, '6'),
         R"({"control":7,"controlText":"acknowledge a notification","property":")" +
             std::string(64, 'f') + "\"}"},
        {"63000000", R"({"control":99,"input":""})"},
        {"63000000" + std::string(512, 'a'),
         R"({"control":99,"input":")" + std::string(512, 'a') + "\"}"},
        {"63000000" + std::string(514, 'a'),
         "the payload has at most 256 bytes behind its number, not 257"},
        {"630000", "the payload has at least 4 bytes, not 3"},
    };
    for (const auto& [digits, fields] : kControls) {
        EXPECT_EQ(decoded("kernel-control", digits), fields);
    }
    EXPECT_EQ(decoded("set-environment-variable", "01000000"),
              R"({"variable":1,"value":"","valueText":"the variable goes"})");
    EXPECT_EQ(decoded("set-environment-variable", "01000000" + std::string(130, '0')),
              "the payload has at most 64 bytes behind its number, not 65");
}

TEST(DecodeTest, FramesOfEveryCommand) {
    EXPECT_EQ(decoded("frame", "44524353 01 02 03 04"),
              R"({"command":1,"commandText":"create-context","secondByte":2,"thirdByte":3,)"
              R"("unusedByte":4,"payload":{}})");
    EXPECT_EQ(decoded("frame", "44524353 02 00 00 00 a0a1"),
              "command 2, delete-context: the payload has 16 bytes, not 2");
    EXPECT_EQ(decoded("frame", "44524353 05 00 00 00"),
              "command 5, add-credential: not a credential command's payload: the check \"size >= "
              "sizeof(KSTHandle) + sizeof(KSTCredential) + sizeof(KSTScope)\" failed");
    EXPECT_EQ(decoded("frame", "44524353 01 02 03"), "a command frame has at least 8 bytes, not 7");
    EXPECT_EQ(decoded("frame", "44524354 01 02 03 04"), "a command frame begins with DRCS");
    for (int code = 0; code < 256; ++code) {
        SCOPED_TRACE(code);
        platform::Bytes frame = bytes("44524353 00 00 00 00");
        frame[4] = static_cast<std::uint8_t>(code);
        frame.resize(8 + 64);
        const auto* const command = findCommand(static_cast<std::uint32_t>(code));
        const std::string text = fieldsOf(findKind("frame")->decode(frame, Secrets::hidden));
        EXPECT_EQ(text.find("bytesUnknown") != std::string::npos, command == nullptr) << text;
    }
}

TEST(DecodeTest, RequirementsDeeperThanCanBeShown) {
    // Each level is "all of" one child; the last is a leaf without data.
    const auto nested = [](std::size_t levels) {
        platform::Bytes tree;
        for (std::size_t i = 1; i < levels; ++i) {
            const auto level = bytes("04000000 00000000 00000000 0c000000 01000000");
            tree.insert(tree.end(), level.begin(), level.end());
        }
        const auto leaf = bytes("06000000 00000000 00000000 04000000 00000000");
        tree.insert(tree.end(), leaf.begin(), leaf.end());
        tree.resize(tree.size() + 12);
        return tree;
    };
    const auto text = [&nested](std::size_t levels) {
        return fieldsOf(decoderOf("requirement")(nested(levels), Secrets::hidden));
    };
    EXPECT_EQ(text(100).find("too deep"), std::string::npos) << text(100).substr(0, 200);
    EXPECT_NE(text(101).find(R"("childrenUnknown":"too deep to be shown")"), std::string::npos);
    EXPECT_NE(text(10'000).find("too deep to be shown"), std::string::npos);
    EXPECT_EQ(gAllocatedBytes, 0);
}

std::vector<std::string> names(const platform::Bytes& input) {
    std::vector<std::string> found;
    for (const Kind* const kind : kindsOf(input)) {
        found.emplace_back(kind->name);
    }
    return found;
}

TEST(DecodeTest, WhatShowsByItself) {
    using Names = std::vector<std::string>;
    const auto all = examples();
    EXPECT_EQ(names(all.at("frame")), Names{"frame"});
    EXPECT_EQ(names(bytes("44524353")), Names{"frame"});
    EXPECT_EQ(names(bytes("4b535445")), Names{"event"});
    EXPECT_EQ(names(all.at("credential-passphrase")), Names{"credential"});
    EXPECT_EQ(names(all.at("credential-list")), Names{"credential-list"});
    EXPECT_EQ(names(all.at("requirement-tree")), Names{"requirement"});
    EXPECT_EQ(names(bytes("00000000")), Names{"credential-list"});
    EXPECT_EQ(names(platform::Bytes(13)), Names{"state"});
    // A marker is as long as the figures.
    EXPECT_EQ(names(all.at("credential-marker")), (Names{"analytics", "credential"}));
    EXPECT_EQ(names({}), Names{});
    EXPECT_EQ(names(all.at("context-property")), Names{});
    platform::Bytes record(36);
    record[0] = 4;
    EXPECT_EQ(names(record), Names{"record"});
    // A leaf with 20 bytes of data is as long as a record, and its type may be a record's.
    record[0] = 1;
    record[12] = 20;
    EXPECT_EQ(names(record), (Names{"record", "requirement"}));
    record.push_back(0);
    EXPECT_EQ(names(record), Names{});
}

TEST(DecodeTest, CommandsByNameAndByNumber) {
    std::set<std::string> seen;
    for (const CommandPayload& command : commandPayloads()) {
        EXPECT_EQ(findCommand(command.name), &command);
        EXPECT_EQ(findCommand(std::string_view(base::concat(command.code))), &command);
        EXPECT_EQ(findCommand(std::uint32_t{command.code}), &command);
        EXPECT_TRUE(seen.insert(std::string(command.name)).second);
    }
    EXPECT_EQ(seen.size(), 17U);
    EXPECT_EQ(findCommand(std::string_view("0")), nullptr);
    EXPECT_EQ(findCommand(std::string_view("05")), nullptr);
    EXPECT_EQ(findCommand(std::string_view("")), nullptr);
    EXPECT_EQ(findKind("nothing"), nullptr);
}

} // namespace
} // namespace kstctl::decode
