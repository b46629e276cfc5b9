#include "bench/peers/PeerCodecs.h"

#include <messages.pb.h>
#include <stdexcept>

namespace bench::protobuf {

namespace {

void fill(proto::Credential& message, const SampleCredential& sample) {
    message.set_type(sample.header.type);
    message.set_word4(sample.header.word4);
    message.set_word8(sample.header.word8);
    message.set_user_id(sample.header.userId);
    message.set_word16(sample.header.word16);
    message.set_word24(sample.header.word24);
    proto::PassphraseEntered& data = *message.mutable_passphrase_entered();
    data.set_purpose(sample.data.purpose);
    data.set_passphrase(sample.data.passphrase, sample.data.passphraseLength);
}

void fill(proto::Requirement& message, const SampleRequirement& sample) {
    message.set_type(sample.type);
    message.set_state(sample.state);
    message.set_priority(sample.priority);
    message.set_k(sample.k);
    message.set_data(sample.data.data(), sample.data.size());
    for (const SampleRequirement& child : sample.children) {
        fill(*message.add_children(), child);
    }
}

void fill(proto::VerifyPolicy& message, const SampleQuestion& sample) {
    message.set_handle(sample.handle.bytes, sizeof sample.handle.bytes);
    message.set_policy(sample.policy);
    message.set_preflight(sample.preflight);
    message.set_max_global_credential_age(sample.maxGlobalCredentialAge);
    for (const SampleParameter& parameter : sample.parameters) {
        proto::Parameter& added = *message.add_parameters();
        added.set_type(parameter.type);
        added.set_value(parameter.value.data(), parameter.value.size());
    }
}

void add(FieldSum& sum, const std::string& bytes) {
    sum.add(bytes.data(), bytes.size());
}

void read(const proto::Credential& message, FieldSum& sum) {
    sum.add(message.type());
    sum.add(message.word4());
    sum.add(message.word8());
    sum.add(message.user_id());
    sum.add(message.word16());
    sum.add(message.word24());
    sum.add(message.passphrase_entered().purpose());
    add(sum, message.passphrase_entered().passphrase());
}

void read(const proto::Requirement& message, FieldSum& sum) {
    sum.add(message.type());
    sum.add(message.state());
    sum.add(message.priority());
    sum.add(message.k());
    add(sum, message.data());
    for (const proto::Requirement& child : message.children()) {
        read(child, sum);
    }
}

void read(const proto::VerifyPolicy& message, FieldSum& sum) {
    add(sum, message.handle());
    add(sum, message.policy());
    sum.add(message.preflight() ? 1 : 0);
    sum.add(message.max_global_credential_age());
    for (const proto::Parameter& parameter : message.parameters()) {
        sum.add(parameter.type());
        add(sum, parameter.value());
    }
}

template <typename Message>
void write(const Message& message, std::uint8_t* buffer, std::size_t size) {
    if (!message.SerializeToArray(buffer, static_cast<int>(size))) {
        throw std::runtime_error("protobuf does not write a message");
    }
}

template <typename Message>
std::uint64_t parse(Message& message, const std::uint8_t* bytes, std::size_t size) {
    if (!message.ParseFromArray(bytes, static_cast<int>(size))) {
        throw std::runtime_error("protobuf does not read what it wrote");
    }
    FieldSum sum;
    read(message, sum);
    return sum.value();
}

/// What is kept from call to call.
template <typename Message>
struct Kept {
    Message written;
    Message parsed;
    Bytes bytes;
};

template <typename Message, typename Sample>
std::shared_ptr<Kept<Message>> keep(const Sample& sample) {
    auto kept = std::make_shared<Kept<Message>>();
    fill(kept->written, sample);
    kept->bytes.resize(kept->written.ByteSizeLong());
    write(kept->written, kept->bytes.data(), kept->bytes.size());
    return kept;
}

template <typename Message>
Codec codecNamed(const char* name, const std::shared_ptr<Kept<Message>>& kept) {
    Codec codec;
    codec.name = name;
    codec.encodedSize = kept->bytes.size();
    codec.fields = parse(kept->parsed, kept->bytes.data(), kept->bytes.size());
    return codec;
}

template <typename Message, typename Sample>
Codec codec(const Sample& sample) {
    const auto kept = keep<Message>(sample);
    Codec codec = codecNamed("protobuf", kept);
    codec.encode = repeated([kept, &sample] {
        kept->written.Clear();
        fill(kept->written, sample);
        write(kept->written, kept->bytes.data(), kept->bytes.size());
    });
    codec.encodeAnew = repeated([&sample] {
        Message message;
        fill(message, sample);
        const std::size_t size = message.ByteSizeLong();
        const auto buffer = newBuffer(size);
        write(message, buffer.get(), size);
    });
    codec.decode =
        repeated([kept] { use(parse(kept->parsed, kept->bytes.data(), kept->bytes.size())); });
    codec.decodeAnew = repeated([kept] {
        Message message;
        use(parse(message, kept->bytes.data(), kept->bytes.size()));
    });
    return codec;
}

template <typename Message, typename Sample>
Codec codecAtHand(const Sample& sample) {
    const auto kept = keep<Message>(sample);
    Codec codec = codecNamed("protobuf, message at hand", kept);
    codec.encode =
        repeated([kept] { write(kept->written, kept->bytes.data(), kept->bytes.size()); });
    codec.encodeAnew = repeated([kept] {
        const std::size_t size = kept->written.ByteSizeLong();
        const auto buffer = newBuffer(size);
        write(kept->written, buffer.get(), size);
    });
    return codec;
}

} // namespace

Codec credential(const SampleCredential& sample) {
    return codec<proto::Credential>(sample);
}

Codec credentialAtHand(const SampleCredential& sample) {
    return codecAtHand<proto::Credential>(sample);
}

Codec requirement(const SampleRequirement& sample) {
    return codec<proto::Requirement>(sample);
}

Codec requirementAtHand(const SampleRequirement& sample) {
    return codecAtHand<proto::Requirement>(sample);
}

Codec question(const SampleQuestion& sample) {
    return codec<proto::VerifyPolicy>(sample);
}

} // namespace bench::protobuf
