#pragma once

#include <atomic>

namespace KivVcs::detail {

/// A word by which what was made once becomes known to all threads: whoever reads the word finds what was written before
/// it was published. What the word stands for is for the layers to say: a value kept elsewhere (`Published`), the same
/// and who made it (`KeptForm`), the state of a value kept beside it (`CachedId`, deferred links).
///
/// Threads: the `const` operations may run concurrently. `Set` and `Take` need exclusive use.
template <class Word>
class PublishedWord {
public:
    PublishedWord() noexcept = default;
    PublishedWord(PublishedWord const&) = delete;
    PublishedWord& operator=(PublishedWord const&) = delete;
    ~PublishedWord() = default;

    [[nodiscard]] Word Get() const noexcept { return word_.load(std::memory_order_acquire); }

    /// Publishes @p next if the word is still @p known; otherwise false, and @p known is what the word has become.
    [[nodiscard]] bool Replace(Word& known, Word next) const noexcept {
        return word_.compare_exchange_strong(known, next, std::memory_order_acq_rel, std::memory_order_acquire);
    }

    /// Publishes @p next, by the one thread that may.
    void Publish(Word next) const noexcept { word_.store(next, std::memory_order_release); }

    /// Publishes @p next and wakes up the threads that wait.
    void PublishToWaiting(Word next) const noexcept {
        Publish(next);
        word_.notify_all();
    }
    void WaitWhile(Word word) const noexcept { word_.wait(word, std::memory_order_acquire); }

    void Set(Word next) noexcept { word_.store(next, std::memory_order_relaxed); }
    [[nodiscard]] Word Take(Word next = {}) noexcept {
        const Word taken = word_.load(std::memory_order_relaxed);
        Set(next);
        return taken;
    }

private:
    mutable std::atomic<Word> word_{Word{}};
};

} // namespace KivVcs::detail
