#include "bench/peers/PeerCodecs.h"

#include <array>
#include <messages_generated.h>
#include <stdexcept>

namespace bench::flatbuffer {

namespace {

using flatbuffers::FlatBufferBuilder;
using flatbuffers::Offset;

Offset<flat::Credential> build(FlatBufferBuilder& builder, const SampleCredential& sample) {
    const auto passphrase =
        builder.CreateVector(sample.data.passphrase, sample.data.passphraseLength);
    const auto data = flat::CreatePassphraseEntered(builder, sample.data.purpose, passphrase);
    return flat::CreateCredential(builder, sample.header.type, sample.header.word4,
                                  sample.header.word8, sample.header.userId, sample.header.word16,
                                  sample.header.word24, flat::CredentialData_PassphraseEntered,
                                  data.Union());
}

// NOLINTNEXTLINE(misc-no-recursion)
Offset<flat::Requirement> build(FlatBufferBuilder& builder, const SampleRequirement& sample) {
    constexpr std::size_t kMaxChildren = 16;
    std::array<Offset<flat::Requirement>, kMaxChildren> built;
    std::size_t count = 0;
    for (const SampleRequirement& child : sample.children) {
        built.at(count++) = build(builder, child);
    }
    // What is not there takes no room.
    const auto children = count > 0 ? builder.CreateVector(built.data(), count) : 0;
    const auto data = !sample.data.empty() ? builder.CreateVector(sample.data) : 0;
    return flat::CreateRequirement(builder, sample.type, sample.state, sample.priority, sample.k,
                                   data, children);
}

Offset<flat::VerifyPolicy> build(FlatBufferBuilder& builder, const SampleQuestion& sample) {
    std::array<Offset<flat::Parameter>, kKSTMaxParameters> built;
    std::size_t count = 0;
    for (const SampleParameter& parameter : sample.parameters) {
        const auto value = builder.CreateVector(parameter.value);
        built.at(count++) = flat::CreateParameter(builder, parameter.type, value);
    }
    const auto parameters = builder.CreateVector(built.data(), count);
    const auto policy = builder.CreateString(sample.policy);
    const flat::Handle handle(
        flatbuffers::span<const std::uint8_t, kKSTHandleSize>(sample.handle.bytes));
    return flat::CreateVerifyPolicy(builder, &handle, policy, sample.preflight,
                                    sample.maxGlobalCredentialAge, parameters);
}

void add(FieldSum& sum, const flatbuffers::Vector<std::uint8_t>* bytes) {
    if (bytes != nullptr) {
        sum.add(bytes->data(), bytes->size());
    } else {
        sum.add(nullptr, 0);
    }
}

void read(const flat::Credential& message, FieldSum& sum) {
    sum.add(message.type());
    sum.add(message.word4());
    sum.add(message.word8());
    sum.add(message.user_id());
    sum.add(message.word16());
    sum.add(message.word24());
    const flat::PassphraseEntered* data = message.data_as_PassphraseEntered();
    sum.add(data->purpose());
    add(sum, data->passphrase());
}

// NOLINTNEXTLINE(misc-no-recursion)
void read(const flat::Requirement& message, FieldSum& sum) {
    sum.add(message.type());
    sum.add(message.state());
    sum.add(message.priority());
    sum.add(message.k());
    add(sum, message.data());
    if (message.children() != nullptr) {
        for (const flat::Requirement* child : *message.children()) {
            read(*child, sum);
        }
    }
}

void read(const flat::VerifyPolicy& message, FieldSum& sum) {
    sum.add(message.handle()->bytes()->data(), kKSTHandleSize);
    sum.add(message.policy()->data(), message.policy()->size());
    sum.add(message.preflight() ? 1 : 0);
    sum.add(message.max_global_credential_age());
    for (const flat::Parameter* parameter : *message.parameters()) {
        sum.add(parameter->type());
        add(sum, parameter->value());
    }
}

template <typename Message>
std::uint64_t verifyAndRead(std::span<const std::uint8_t> bytes) {
    flatbuffers::Verifier verifier(bytes.data(), bytes.size());
    if (!verifier.VerifyBuffer<Message>(nullptr)) {
        throw std::runtime_error("flatbuffers does not verify what it wrote");
    }
    FieldSum sum;
    read(*flatbuffers::GetRoot<Message>(bytes.data()), sum);
    return sum.value();
}

template <typename Message, typename Sample>
Codec codec(const Sample& sample) {
    const auto kept = std::make_shared<FlatBufferBuilder>();
    const auto encode = [kept, &sample] {
        kept->Clear();
        kept->Finish(build(*kept, sample));
    };
    encode();
    const auto bytes = std::make_shared<Bytes>(kept->GetBufferPointer(),
                                               kept->GetBufferPointer() + kept->GetSize());
    Codec codec;
    codec.name = "flatbuffers";
    codec.encodedSize = bytes->size();
    codec.fields = verifyAndRead<Message>(*bytes);
    codec.encode = repeated(encode);
    codec.encodeAnew = repeated([&sample, size = bytes->size()] {
        // Never has to grow.
        FlatBufferBuilder builder(2 * size);
        builder.Finish(build(builder, sample));
        use(builder.GetBufferPointer());
    });
    codec.decode = repeated([bytes] { use(verifyAndRead<Message>(*bytes)); });
    codec.decodeAnew = codec.decode;
    return codec;
}

} // namespace

Codec credential(const SampleCredential& sample) {
    return codec<flat::Credential>(sample);
}

Codec requirement(const SampleRequirement& sample) {
    return codec<flat::Requirement>(sample);
}

Codec question(const SampleQuestion& sample) {
    return codec<flat::VerifyPolicy>(sample);
}

} // namespace bench::flatbuffer
