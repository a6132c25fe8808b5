#pragma once

// Values of the library as JavaScript has them: identifiers and texts are strings, contents Uint8Arrays, "none" is null.

#include <KivVcs/KivVcs.h>

#include <emscripten/val.h>

#include <string>

namespace KivVcs::JavaScript {

using emscripten::val;

inline constexpr std::int64_t ticksPerMinute = 600'000'000;

inline KivStringT<char16_t> FromJavaScript(std::u16string const& text) {
    return {text.data(), static_cast<int>(text.size())};
}

inline std::u16string ToJavaScript(KivStringT<char16_t> const& text) {
    return {text.GetString(), static_cast<std::size_t>(text.GetLength())};
}

inline std::u16string ToJavaScript(Id const& id) {
    return ToJavaScript(id.GetText());
}

inline Id IdOf(std::u16string const& text) {
    return Id(FromJavaScript(text));
}

inline Buffer ToBuffer(val const& bytes) {
    const auto size = bytes["length"].as<std::uint32_t>();
    return Buffer::Build(size, [&](std::byte* destination) {
        // Only now: a view of the memory is no longer one when the memory has grown.
        val(emscripten::typed_memory_view(size, reinterpret_cast<std::uint8_t*>(destination))).call<void>("set", bytes);
    });
}

inline val ToUint8Array(Buffer const& buffer) {
    val array = val::global("Uint8Array").new_(static_cast<double>(buffer.GetSize()));
    double offset = 0;
    for (auto const& chunk : buffer.LockForRead()) {
        array.call<void>(
            "set", emscripten::typed_memory_view(chunk.size(), reinterpret_cast<const std::uint8_t*>(chunk.data())),
            offset);
        offset += static_cast<double>(chunk.size());
    }
    return array;
}

template <class Texts>
val ToArray(Texts const& texts) {
    val array = val::array();
    for (auto const& text : texts)
        array.call<void>("push", ToJavaScript(text));
    return array;
}

inline val ToObject(MergeConflict const& conflict) {
    val object = val::object();
    object.set("path", ToJavaScript(conflict.path));
    object.set("isDirectory", conflict.isDirectory);
    object.set("leftChange", static_cast<int>(conflict.leftChange));
    object.set("rightChange", static_cast<int>(conflict.rightChange));
    object.set("rootId", ToJavaScript(conflict.rootId));
    object.set("leftId", ToJavaScript(conflict.leftId));
    object.set("rightId", ToJavaScript(conflict.rightId));
    object.set("settlement", static_cast<int>(conflict.settlement));
    return object;
}

/// The identifier of @p object and whether it is a directory; null if there is none.
inline val Describe(cow_ptr<Object> const& object) {
    if (!object)
        return val::null();
    val entry = val::object();
    entry.set("id", ToJavaScript(object->GetId()));
    entry.set("isDirectory", object->GetHeader() == KivStringT<char>("tree"));
    return entry;
}

inline cow_ptr<Tree> RootOf(Commit const& commit) {
    return commit.GetCommitTree() ? commit.GetCommitTree()->GetRoot() : nullptr;
}

inline cow_ptr<Tree> RootOf(cow_ptr<Commit> const& commit) {
    return commit ? RootOf(*commit) : nullptr;
}

} // namespace KivVcs::JavaScript
