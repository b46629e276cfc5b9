#include "bench/peers/PeerCodecs.h"

#include <array>
#include <capnp/message.h>
#include <capnp/serialize.h>
#include <kj/io.h>
#include <messages.capnp.h>

namespace bench::capnproto {

namespace {

capnp::Data::Reader dataOf(const std::uint8_t* bytes, std::size_t size) {
    return {bytes, size};
}

void fill(capn::Credential::Builder message, const SampleCredential& sample) {
    message.setType(sample.header.type);
    message.setWord4(sample.header.word4);
    message.setWord8(sample.header.word8);
    message.setUserId(sample.header.userId);
    message.setWord16(sample.header.word16);
    message.setWord24(sample.header.word24);
    auto data = message.getData().initPassphraseEntered();
    data.setPurpose(sample.data.purpose);
    data.setPassphrase(dataOf(sample.data.passphrase, sample.data.passphraseLength));
}

// NOLINTNEXTLINE(misc-no-recursion)
void fill(capn::Requirement::Builder message, const SampleRequirement& sample) {
    message.setType(sample.type);
    message.setState(sample.state);
    message.setPriority(sample.priority);
    message.setK(sample.k);
    // What is not there takes no room.
    if (!sample.data.empty()) {
        message.setData(dataOf(sample.data.data(), sample.data.size()));
    }
    if (!sample.children.empty()) {
        auto children = message.initChildren(static_cast<unsigned>(sample.children.size()));
        unsigned index = 0;
        for (const SampleRequirement& child : sample.children) {
            fill(children[index++], child);
        }
    }
}

void fill(capn::VerifyPolicy::Builder message, const SampleQuestion& sample) {
    std::array<std::uint64_t, 2> handle{};
    std::memcpy(handle.data(), sample.handle.bytes, sizeof handle);
    message.setHandleFirst(handle[0]);
    message.setHandleSecond(handle[1]);
    message.setPolicy({sample.policy.c_str(), sample.policy.size()});
    message.setPreflight(sample.preflight);
    message.setMaxGlobalCredentialAge(sample.maxGlobalCredentialAge);
    auto parameters = message.initParameters(static_cast<unsigned>(sample.parameters.size()));
    unsigned index = 0;
    for (const SampleParameter& parameter : sample.parameters) {
        auto added = parameters[index++];
        added.setType(parameter.type);
        added.setValue(dataOf(parameter.value.data(), parameter.value.size()));
    }
}

void read(capn::Credential::Reader message, FieldSum& sum) {
    sum.add(message.getType());
    sum.add(message.getWord4());
    sum.add(message.getWord8());
    sum.add(message.getUserId());
    sum.add(message.getWord16());
    sum.add(message.getWord24());
    const auto data = message.getData().getPassphraseEntered();
    sum.add(data.getPurpose());
    const auto passphrase = data.getPassphrase();
    sum.add(passphrase.begin(), passphrase.size());
}

// NOLINTNEXTLINE(misc-no-recursion)
void read(capn::Requirement::Reader message, FieldSum& sum) {
    sum.add(message.getType());
    sum.add(message.getState());
    sum.add(message.getPriority());
    sum.add(message.getK());
    const auto data = message.getData();
    sum.add(data.begin(), data.size());
    for (const auto child : message.getChildren()) {
        read(child, sum);
    }
}

void read(capn::VerifyPolicy::Reader message, FieldSum& sum) {
    const std::array<std::uint64_t, 2> handle{message.getHandleFirst(), message.getHandleSecond()};
    sum.add(handle.data(), sizeof handle);
    const auto policy = message.getPolicy();
    sum.add(policy.begin(), policy.size());
    sum.add(message.getPreflight() ? 1 : 0);
    sum.add(message.getMaxGlobalCredentialAge());
    for (const auto parameter : message.getParameters()) {
        sum.add(parameter.getType());
        const auto value = parameter.getValue();
        sum.add(value.begin(), value.size());
    }
}

template <typename Message>
std::uint64_t parse(kj::ArrayPtr<const capnp::word> words) {
    capnp::FlatArrayMessageReader reader(words);
    FieldSum sum;
    read(reader.getRoot<Message>(), sum);
    return sum.value();
}

/// What is kept from call to call: the room in which a message is made, and its bytes.
struct Kept {
    kj::Array<capnp::word> room;
    kj::Array<capnp::word> bytes;
};

/// A message that is made in the room that is kept fits there.
template <typename Message, typename Sample>
std::shared_ptr<Kept> keep(const Sample& sample) {
    auto kept = std::make_shared<Kept>();
    capnp::MallocMessageBuilder message;
    fill(message.initRoot<Message>(), sample);
    kept->bytes = capnp::messageToFlatArray(message);
    kept->room = kj::heapArray<capnp::word>(kept->bytes.size());
    std::memset(kept->room.begin(), 0, kept->room.asBytes().size());
    return kept;
}

template <typename Message, typename Sample>
Codec codec(const Sample& sample) {
    const auto kept = keep<Message>(sample);
    Codec codec;
    codec.name = "Cap'n Proto";
    codec.encodedSize = kept->bytes.asBytes().size();
    codec.fields = parse<Message>(kept->bytes);
    codec.encode = repeated([kept, &sample] {
        capnp::MallocMessageBuilder message(kept->room);
        fill(message.initRoot<Message>(), sample);
        kj::ArrayOutputStream output(kept->bytes.asBytes());
        capnp::writeMessage(output, message);
    });
    codec.encodeAnew = repeated([&sample, words = kept->room.size()] {
        capnp::MallocMessageBuilder message(static_cast<unsigned>(words));
        fill(message.initRoot<Message>(), sample);
        const kj::Array<capnp::word> bytes = capnp::messageToFlatArray(message);
        use(bytes.begin());
    });
    codec.decode = repeated([kept] { use(parse<Message>(kept->bytes)); });
    codec.decodeAnew = codec.decode;
    return codec;
}

} // namespace

Codec credential(const SampleCredential& sample) {
    return codec<capn::Credential>(sample);
}

Codec requirement(const SampleRequirement& sample) {
    return codec<capn::Requirement>(sample);
}

Codec question(const SampleQuestion& sample) {
    return codec<capn::VerifyPolicy>(sample);
}

} // namespace bench::capnproto
