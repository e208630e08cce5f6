// The registry stand-in: the machine hive behind ZwCreateKey and
// ZwQueryValueKey, with the controls tests and the lab use to fill it, break it
// and see what the module did with it.
//
// Controls name keys by full kernel path ("\Registry\Machine\System\...") and
// take text as UTF-8; names match case-insensitively, as in the kernel. A bad
// path given to a control throws std::invalid_argument: that is a mistake in
// the test, not something the module did.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "../../kernel/ntkernel.h"

namespace sim::kernel {

// Kernel statuses of the registry calls that the module can meet.
constexpr NTSTATUS kStatusBufferOverflow = static_cast<NTSTATUS>(0x80000005u);
constexpr NTSTATUS kStatusAccessViolation = static_cast<NTSTATUS>(0xC0000005u);
constexpr NTSTATUS kStatusInvalidHandle = static_cast<NTSTATUS>(0xC0000008u);
constexpr NTSTATUS kStatusInvalidParameter = static_cast<NTSTATUS>(0xC000000Du);
constexpr NTSTATUS kStatusAccessDenied = static_cast<NTSTATUS>(0xC0000022u);
constexpr NTSTATUS kStatusBufferTooSmall = static_cast<NTSTATUS>(0xC0000023u);
constexpr NTSTATUS kStatusObjectNameInvalid = static_cast<NTSTATUS>(0xC0000033u);
constexpr NTSTATUS kStatusObjectPathSyntaxBad = static_cast<NTSTATUS>(0xC000003Bu);
constexpr NTSTATUS kStatusKeyDeleted = static_cast<NTSTATUS>(0xC000017Cu);

// What ZwCreateKey reports through its disposition.
constexpr uint32_t kRegCreatedNewKey = 1;
constexpr uint32_t kRegOpenedExistingKey = 2;

struct RegistryKey;

struct RegistryValue {
    std::string name;  // as it was first set
    uint32_t type = 0;
    std::vector<uint8_t> data;
};

// Value data as the registry stores text: UTF-16LE, with or without the NUL.
std::vector<uint8_t> utf16leBytes(const std::string& text, bool withTerminator = true);
// REG_MULTI_SZ data: each text with its NUL, then one more NUL.
std::vector<uint8_t> multiStringBytes(const std::vector<std::string>& texts);

struct RegistryKeyContent {
    std::string path;  // full kernel path, "\\Registry\\Machine\\..."
    std::vector<RegistryValue> values;
};

// One registry call of the module, as the stand-in saw it.
struct RegistryCall {
    enum class Kind { createKey, queryValue };
    Kind kind = Kind::createKey;
    std::string keyPath;         // createKey: the name passed; queryValue: the name the key was opened by
    std::string valueName;       // queryValue only
    uint32_t desiredAccess = 0;  // createKey only
    uint32_t bufferLength = 0;   // queryValue only
    NTSTATUS result = 0;
    bool created = false;  // createKey: the call created the key
};

class Registry {
public:
    Registry();
    // An empty machine hive, no faults, no calls seen.
    void reset();

    void createKey(const std::string& path);  // and every missing parent
    bool keyExists(const std::string& path) const;
    // With its subkeys and values; a missing key is no error. Handles still
    // open on the key see it as deleted, as in the kernel.
    void deleteKey(const std::string& path);

    // An empty name is the key's default value. Setting a value creates its key.
    void setValue(const std::string& keyPath, const std::string& name, uint32_t type, std::vector<uint8_t> data);
    void setString(const std::string& keyPath, const std::string& name, const std::string& text,
                   bool withTerminator = true);  // REG_SZ
    void setDword(const std::string& keyPath, const std::string& name, uint32_t value);
    void deleteValue(const std::string& keyPath, const std::string& name);
    std::optional<RegistryValue> value(const std::string& keyPath, const std::string& name) const;

    // Faults: ZwCreateKey of that key, or ZwQueryValueKey of that value,
    // returns the status instead of doing its work: at every call, or with a
    // number, at that call only (1 = the next call of that key or value).
    // The status must be a failure. A query failing with
    // STATUS_BUFFER_OVERFLOW still fills the record's header and the result
    // length, as the kernel does when the data does not fit.
    void failCreateKey(const std::string& path, NTSTATUS status, uint64_t number = 0);
    void failQuery(const std::string& keyPath, const std::string& valueName, NTSTATUS status, uint64_t number = 0);
    void clearFaults();

    // Every ZwCreateKey and ZwQueryValueKey since the last reset, in order.
    const std::vector<RegistryCall>& calls() const { return calls_; }
    // A call that another kernel answered (Wine's, for the lab's Windows
    // engine), logged beside this one's so that reports read both alike.
    void noteCall(const RegistryCall& call) { calls_.push_back(call); }
    // The names of the keys that ZwCreateKey created, as the module passed them.
    std::vector<std::string> createdKeys() const;
    // Every key below the machine hive that holds values or lies below its
    // roots, with its values: what an export of the hive lists.
    std::vector<RegistryKeyContent> contents() const;

private:
    friend struct RegistryKernelSide;

    struct OpenKey {
        std::shared_ptr<RegistryKey> key;
        std::string name;           // as the module passed it, for the call log
        std::u16string foldedPath;  // for matching query faults
    };

    RegistryKey* findKey(const std::string& path) const;

    std::shared_ptr<RegistryKey> root_;  // the object namespace's root, holding Registry\Machine
    std::map<intptr_t, OpenKey> openKeys_;
    // The faults of one key or value, and how often it was called since they were set.
    struct CallFaults {
        NTSTATUS everyCall = 0;
        std::map<uint64_t, NTSTATUS> byNumber;
        uint64_t calls = 0;
    };
    // The status a call of this key or value fails with, or 0; counts the call.
    template <typename Key>
    static NTSTATUS injectedFailure(std::map<Key, CallFaults>& faults, const Key& key);

    std::map<std::u16string, CallFaults> createFaults_;
    std::map<std::pair<std::u16string, std::u16string>, CallFaults> queryFaults_;
    std::vector<RegistryCall> calls_;
};

Registry& registry();

}  // namespace sim::kernel
