#include "KivPlatform/String.h"

#include <charconv>
#include <new>
#include <stdexcept>

namespace KivPlatform {

template <class C>
KivStringT<C>::KivStringT(View text) {
    if (text.IsEmpty())
        return;
    text_ = Allocate(text.GetLength());
    std::copy(text.begin(), text.end(), Characters());
}

template <class C>
KivStringT<C>& KivStringT<C>::operator+=(View text) {
    if (text.IsEmpty())
        return *this;
    const int length = GetLength();
    if (text.GetLength() > std::numeric_limits<int>::max() - length)
        throw std::length_error("text longer than a signed 32-bit length can hold");
    const int joined = length + text.GetLength();
    if (text_.use_count() == 1 && text_->capacity >= joined) {
        std::copy(text.begin(), text.end(), Characters() + length);
        text_->length = joined;
        Characters()[joined] = C{};
        return *this;
    }
    // A first append is taken as the only one; from the second on the room grows by half, so that loops stay linear.
    const int room = !text_ || length > std::numeric_limits<int>::max() / 2 ? joined : std::max(joined, length / 2 * 3);
    KivStringT grown;
    grown.text_ = Allocate(room);
    std::copy_n(GetString(), length, grown.Characters());
    std::copy(text.begin(), text.end(), grown.Characters() + length);
    grown.text_->length = joined;
    grown.Characters()[joined] = C{};
    Swap(grown);
    return *this;
}

template <class C>
typename KivStringT<C>::Handle KivStringT<C>::Allocate(int capacity) {
    const auto units = static_cast<std::size_t>(capacity) + 1;
    auto* text = ::new (::operator new(sizeof(Text) + units * sizeof(C))) Text;
    text->length = capacity;
    text->capacity = capacity;
    reinterpret_cast<C*>(text + 1)[capacity] = C{};
    return Handle(text);
}

template <class C>
void KivStringT<C>::Destroy(Text* text) noexcept {
    text->~Text();
    ::operator delete(text);
}

namespace {

/// One directive of a format: what stands between the percent sign and the conversion letter.
struct Directive {
    bool padWithZeros = false;
    bool takesLength = false;
    int width = 0;
};

/// Reads flags, width, precision and length modifiers at @p position, which ends on the conversion letter.
template <class C>
Directive ParseDirective(KivStringViewT<C> format, int& position) {
    Directive directive;
    for (; position < format.GetLength(); ++position) {
        const C unit = format[position];
        if (unit == C{'.'} && position + 1 < format.GetLength() && format[position + 1] == C{'*'}) {
            directive.takesLength = true;
            ++position;
        } else if (unit == C{'0'} && directive.width == 0) {
            directive.padWithZeros = true;
        } else if (unit >= C{'0'} && unit <= C{'9'}) {
            directive.width = std::min(directive.width * 10 + static_cast<int>(unit - C{'0'}), 1 << 16);
        } else if (unit != C{'l'}) {
            break;
        }
    }
    return directive;
}

template <class C>
KivStringT<C> WriteNumber(Directive directive, FormatArgument<C> const& argument) {
    std::array<char, 20> digits{};
    const auto end = std::to_chars(digits.data(), digits.data() + digits.size(), argument.Magnitude()).ptr;
    const int count = static_cast<int>(end - digits.data());
    const int padding = std::max(directive.width - count - (argument.IsNegative() ? 1 : 0), 0);
    KivStringT<C> number;
    for (int blank = 0; blank < padding && !directive.padWithZeros; ++blank)
        number += C{' '};
    if (argument.IsNegative())
        number += C{'-'};
    for (int zero = 0; zero < padding && directive.padWithZeros; ++zero)
        number += C{'0'};
    for (int digit = 0; digit < count; ++digit)
        number += static_cast<C>(digits[static_cast<std::size_t>(digit)]);
    return number;
}

} // namespace

template <class C>
void KivStringT<C>::FormatList(View format, const FormatArgument<C>* arguments, std::size_t count) {
    KivStringT result;
    const FormatArgument<C>* const last = arguments + count;
    for (int position = 0; position < format.GetLength(); ++position) {
        if (format[position] != C{'%'}) {
            result += format[position];
            continue;
        }
        const Directive directive = ParseDirective(format, ++position);
        if (position >= format.GetLength())
            break;
        const C conversion = format[position];
        if (conversion == C{'%'}) {
            result += conversion;
            continue;
        }
        int limit = std::numeric_limits<int>::max();
        if (directive.takesLength && arguments != last)
            limit = static_cast<int>((arguments++)->Magnitude());
        if (arguments == last)
            continue;
        if (conversion == C{'s'} && arguments->Text() != nullptr) {
            // With a length given the text need not be terminated, so no more than that much of it may be read.
            const C* const text = arguments->Text();
            const int length = directive.takesLength ? static_cast<int>(std::find(text, text + limit, C{}) - text)
                                                     : View(text).GetLength();
            result += View(text, length);
        } else if (conversion == C{'d'} || conversion == C{'u'}) {
            result += View(WriteNumber(directive, *arguments));
        }
        ++arguments;
    }
    Swap(result);
}

template class KivStringT<char>;
template class KivStringT<char16_t>;

} // namespace KivPlatform
