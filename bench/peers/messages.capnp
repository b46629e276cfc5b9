@0xb3f1c6a2d94e7085;

using Cxx = import "/capnp/c++.capnp";
$Cxx.namespace("bench::capn");

struct PassphraseEntered {
  purpose @0 :UInt32;
  passphrase @1 :Data;
}

struct Credential {
  type @0 :UInt32;
  word4 @1 :UInt32;
  word8 @2 :UInt32;
  userId @3 :UInt32;
  word16 @4 :UInt64;
  word24 @5 :UInt32;
  data :union {
    none @6 :Void;
    passphraseEntered @7 :PassphraseEntered;
  }
}

struct Requirement {
  type @0 :UInt32;
  state @1 :UInt32;
  priority @2 :UInt32;
  k @3 :UInt32;
  data @4 :Data;
  children @5 :List(Requirement);
}

struct Parameter {
  type @0 :UInt32;
  value @1 :Data;
}

struct VerifyPolicy {
  handleFirst @0 :UInt64;
  handleSecond @1 :UInt64;
  policy @2 :Text;
  preflight @3 :Bool;
  maxGlobalCredentialAge @4 :UInt32;
  parameters @5 :List(Parameter);
}
