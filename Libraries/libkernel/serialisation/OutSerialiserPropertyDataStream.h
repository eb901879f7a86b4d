#pragma once

#include "libkernel/core/IDTag.h"
#include "libkernel/core/SourceLocation.h"
#include "libkernel/core/String.h"
#include "libkernel/serialisation/EnumSerialiser.h"
#include "libkernel/serialisation/OutSerialiser.h"
#include "libkernel/serialisation/PropType.h"

#include <deque>
#include <ranges>
#include <vector>

namespace Kernel {

/// One property that is a sequence of untagged values, to be read in the order in which they were written. While it is
/// open its serialiser takes nothing else. Values are never left out, and the abort flag is not looked at. Does nothing
/// on a pass that only enumerates. Failures are those of OutSerialiser; a value after Close is code 5.
class KERNEL_API OutSerialiserPropertyDataStream
{
public:
    /// Throws SaveException with code 5 if @p out has an active child. @p version is the caller's.
    OutSerialiserPropertyDataStream(OutSerialiser& out, IDTag tag, unsigned short version);
    OutSerialiserPropertyDataStream(OutSerialiserPropertyDataStream const&) = delete;
    OutSerialiserPropertyDataStream& operator=(OutSerialiserPropertyDataStream const&) = delete;
    /// Frees the serialiser even if Close was never called; the file is then damaged.
    ~OutSerialiserPropertyDataStream();

    /// Ends the sequence. Further calls do nothing.
    void Close();

    template <PropValue T>
    void SaveValue(T const& value)
    {
        SaveValueI(PropTypeOf<T>(), &value, sizeof(T));
    }
    template <std::same_as<bool> T>
    void SaveValue(T value)
    {
        SaveBoolI(value);
    }
    void SaveValue(String8 const& text);
    void SaveValue(String16 const& text);
    void SaveValue(String32 const& text);
    void SaveValue(char const* text) { SaveValue(String8(text)); }
    template <JsonValue T>
    void SaveValue(T const& value)
    {
        auto const text = value.dump();
        SaveStringI(text.data(), text.size());
    }

    template <PropValue T>
    void SaveValues(T const* values, u64 count)
    {
        SaveValueArrayI(PropTypeOf<T>(), values, sizeof(T), count);
    }
    void SaveValues(bool const* values, u64 count);
    void SaveValues(std::vector<bool> const& values);
    void SaveValues(std::deque<bool> const& values);
    void SaveValues(String8 const* texts, u64 count);
    void SaveValues(String16 const* texts, u64 count);
    void SaveValues(String32 const* texts, u64 count);
    template <std::ranges::contiguous_range R>
    void SaveValues(R const& values)
    {
        SaveValues(std::ranges::data(values), std::ranges::size(values));
    }

    /// A struct of at most 65,535 bytes, with its size.
    template <class T>
    requires std::is_trivially_copyable_v<T>
    void SaveValueStruct(T const& value) { SaveValueStructI(&value, sizeof(T)); }
    template <std::ranges::contiguous_range R>
    requires std::is_trivially_copyable_v<std::ranges::range_value_t<R>>
    void SaveValueStructs(R const& values)
    {
        SaveValueStructArrayI(std::ranges::data(values), sizeof(std::ranges::range_value_t<R>),
                              std::ranges::size(values));
    }
    void SaveValueRaw(void const* bytes, u64 size);
    template <class E>
    void SaveEnum(EnumSerialiser const& serialiser, E value)
    {
        SaveEnumI(serialiser, static_cast<int>(value));
    }
    template <std::ranges::input_range R>
    void SaveEnums(EnumSerialiser const& serialiser, R const& values)
    {
        std::vector<int> numbers;
        for (auto const value : values) numbers.push_back(static_cast<int>(value));
        SaveEnumsI(serialiser, numbers.data(), numbers.size());
    }

    /// A value of fixed size, raw structs included; code 5 for a type that can't stand here.
    void SaveValueI(PropType type, void const* value, u64 size);
    void SaveValueArrayI(PropType type, void const* values, u64 unitSize, u64 count);
    void SaveValueStructI(void const* value, u64 size);
    void SaveValueStructArrayI(void const* values, u64 unitSize, u64 count);
    void SaveEnumI(EnumSerialiser const& serialiser, int value);
    void SaveEnumsI(EnumSerialiser const& serialiser, int const* values, u64 count);
    /// Begins an array of @p count values of fixed size, or of structs of @p unitSize bytes each; the bytes follow by
    /// AppendI, exactly as many.
    void StartNewValueArrayI(PropType type, u64 count);
    void StartNewValueCustomPackI(u64 unitSize, u64 count);
    void AppendI(void const* bytes, u64 size);

private:
    [[noreturn]] void Fail(int code, SourceLocation where = SourceLocation::Current()) const;
    bool StartValueI() const;
    void CheckTypeI(PropType type, u64 size) const;
    void SaveBoolI(bool value);
    void SaveStringI(char const* utf8, u64 length);
    template <class Bools>
    void SaveBoolsI(Bools const& values, u64 count);

    OutSerialiser& m_out;
    bool m_isClosed = false;
};

} // namespace Kernel
