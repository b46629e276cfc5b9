#include "bench/codec/ProductCodecs.h"

#include "KSTLib/KSTLib.h"
#include "KSTLib/LibCall.h"
#include "KSTLib/Serialization.h"
#include "base/Concat.h"

#include <stdexcept>

namespace bench {

namespace {

void require(KSTStatus status) {
    if (status != kKSTErrorSuccess) {
        throw std::runtime_error(base::concat("the library fails, status ", status));
    }
}

/// The codec of a payload: `Payload` measures, writes, and reads with a sum of the fields.
template <typename Payload>
Codec codec(const std::shared_ptr<Payload>& payload) {
    const auto bytes = std::make_shared<Bytes>(payload->size());
    payload->write(bytes->data(), bytes->size());
    Codec codec;
    codec.name = "product";
    codec.encodedSize = bytes->size();
    codec.fields = payload->read(*bytes);
    codec.encode = repeated([payload, bytes] { payload->write(bytes->data(), bytes->size()); });
    codec.encodeAnew = repeated([payload] {
        const std::size_t size = payload->size();
        const auto buffer = newBuffer(size);
        payload->write(buffer.get(), size);
    });
    codec.decode = repeated([payload, bytes] { use(payload->read(*bytes)); });
    codec.decodeAnew = codec.decode;
    return codec;
}

class CredentialPayload {
  public:
    explicit CredentialPayload(const SampleCredential& sample) : sample_(sample) {}

    [[nodiscard]] std::size_t size() const {
        std::size_t size = 0;
        require(GetSerializedCredentialSize(&sample_.header, &size));
        return size;
    }

    void write(std::uint8_t* buffer, std::size_t size) const {
        require(SerializeCredential(&sample_.header, buffer, &size));
    }

    [[nodiscard]] static std::uint64_t read(const Bytes& bytes) {
        KSTCredential* credential = nullptr;
        std::size_t consumed = 0;
        require(DeserializeCredential(bytes.data(), bytes.size(), &credential, &consumed));
        FieldSum sum;
        sum.add(credential->type);
        sum.add(credential->word4);
        sum.add(credential->word8);
        sum.add(credential->userId);
        sum.add(credential->word16);
        sum.add(credential->word24);
        const auto* data =
            reinterpret_cast<const KSTCredentialDataPassphraseEntered*>(credential + 1);
        sum.add(data->purpose);
        sum.add(data->passphrase, data->passphraseLength);
        DeallocCredential(credential);
        return sum.value();
    }

  private:
    const SampleCredential& sample_;
};

class RequirementPayload {
  public:
    explicit RequirementPayload(const SampleRequirement& sample)
        : tree_(treeOf(wireBytes(sample))) {}

    [[nodiscard]] std::size_t size() const {
        std::size_t size = 0;
        require(GetSerializedRequirementSize(tree_.get(), &size));
        return size;
    }

    void write(std::uint8_t* buffer, std::size_t size) const {
        require(SerializeRequirement(tree_.get(), buffer, &size));
    }

    [[nodiscard]] static std::uint64_t read(const Bytes& bytes) {
        KSTRequirement* tree = nullptr;
        std::size_t consumed = 0;
        require(DeserializeRequirement(bytes.data(), bytes.size(), &tree, &consumed));
        FieldSum sum;
        walk(tree, sum);
        DeallocRequirement(tree);
        return sum.value();
    }

  private:
    // NOLINTNEXTLINE(misc-no-recursion)
    static void walk(const KSTRequirement* node, FieldSum& sum) {
        const auto* data = reinterpret_cast<const std::uint8_t*>(node + 1);
        const bool isKofN = node->type == kKSTRequirementTypeKofN;
        const bool isComposite =
            isKofN || node->type == kKSTRequirementTypeAnd || node->type == kKSTRequirementTypeOr;
        sum.add(node->type);
        sum.add(node->state);
        sum.add(node->priority);
        sum.add(isKofN ? reinterpret_cast<const KSTRequirementDataKofN*>(data)->k : 0);
        sum.add(data, isComposite ? 0 : node->dataLength);
        if (isComposite) {
            KSTRequirementGetSubrequirements(
                node, [&sum](const KSTRequirement* child) { walk(child, sum); });
        }
    }

    Tree tree_;
};

class QuestionPayload {
  public:
    explicit QuestionPayload(const SampleQuestion& sample) : sample_(sample) {
        for (const SampleParameter& parameter : sample.parameters) {
            parameters_.push_back({parameter.type, parameter.value.data(),
                                   static_cast<std::uint32_t>(parameter.value.size())});
        }
    }

    [[nodiscard]] std::size_t size() const {
        std::size_t size = 0;
        require(GetSerializedVerifyPolicySize(
            &sample_.handle, sample_.policy.c_str(), sample_.preflight ? 1 : 0,
            sample_.maxGlobalCredentialAge, parameters_.data(), parameterCount(), &size));
        return size;
    }

    void write(std::uint8_t* buffer, std::size_t size) const {
        require(SerializeVerifyPolicy(&sample_.handle, sample_.policy.c_str(),
                                      sample_.preflight ? 1 : 0, sample_.maxGlobalCredentialAge,
                                      parameters_.data(), parameterCount(), buffer, &size));
    }

    [[nodiscard]] static std::uint64_t read(const Bytes& bytes) {
        KSTHandle handle{};
        char* policy = nullptr;
        std::uint8_t preflight = 0;
        std::uint32_t age = 0;
        KSTParameter* parameters = nullptr;
        std::uint32_t count = 0;
        require(DeserializeVerifyPolicy(bytes.data(), bytes.size(), &handle, &policy, &preflight,
                                        &age, &parameters, &count));
        const std::size_t policyLength = std::strlen(policy);
        FieldSum sum;
        sum.add(handle.bytes, sizeof handle.bytes);
        sum.add(policy, policyLength);
        sum.add(preflight);
        sum.add(age);
        for (const KSTParameter& parameter : std::span(parameters, count)) {
            sum.add(parameter.type);
            sum.add(parameter.parameterData, parameter.parameterDataLength);
        }
        DeallocParameters(parameters, count);
        DeallocDataBlob(policy, policyLength + 1);
        return sum.value();
    }

  private:
    [[nodiscard]] std::uint32_t parameterCount() const {
        return static_cast<std::uint32_t>(parameters_.size());
    }

    const SampleQuestion& sample_;
    std::vector<KSTParameter> parameters_;
};

} // namespace

Codec product::credential(const SampleCredential& sample) {
    return codec(std::make_shared<CredentialPayload>(sample));
}

Codec product::requirement(const SampleRequirement& sample) {
    return codec(std::make_shared<RequirementPayload>(sample));
}

Codec product::question(const SampleQuestion& sample) {
    return codec(std::make_shared<QuestionPayload>(sample));
}

Codec copying::bytes(std::size_t size) {
    const auto from = std::make_shared<Bytes>(size, std::uint8_t{0x5a});
    const auto to = std::make_shared<Bytes>(size);
    // Of a size that the compiler does not know, as in all codecs.
    const Work copy = repeated([from, to] { std::memcpy(to->data(), from->data(), from->size()); });
    const Work copyAnew = repeated([from] {
        const auto buffer = newBuffer(from->size());
        std::memcpy(buffer.get(), from->data(), from->size());
        use(buffer.get());
    });
    return {.name = "memcpy",
            .encodedSize = size,
            .encode = copy,
            .encodeAnew = copyAnew,
            .decode = copy,
            .decodeAnew = copyAnew};
}

} // namespace bench
