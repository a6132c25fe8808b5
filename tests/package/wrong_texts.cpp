#include <KivVcs/KivVcs.h>

#include <string>

// Every WRONG is 8-bit text where UTF-16 text is wanted; none at all compiles.
void Use(KivVcs::Repository& repository, KivVcs::Commit& commit, KivVcs::KivStringT<char16_t> text, std::string bytes) {
#if WRONG == 1
    commit.AddBlob(&repository, "notes.txt", KivVcs::Blob());
#elif WRONG == 2
    commit.SetDescription(bytes);
#elif WRONG == 3
    text = "Ada";
#elif WRONG == 4
    text += bytes;
#elif WRONG == 5
    repository.Checkout(text + "/" + text);
#elif WRONG == 6
    commit.AddBlob(&repository, text == bytes ? u"a" : u"b", KivVcs::Blob());
#elif WRONG == 7
    commit.AddObject(&repository, u"notes.txt", KivVcs::Id(bytes));
#elif WRONG == 8
    repository.CreateBranch(std::string_view(bytes), nullptr);
#else
    commit.AddBlob(&repository, nullptr, KivVcs::Blob::CopyText("8-bit"));
    commit.SetDescription(nullptr);
    commit.SetAuthorName(KivVcs::FromUtf8(bytes));
    text += KivVcs::KivStringT<char16_t>(KivVcs::KivStringT<char>("8-bit"));
    KivVcs::Buffer buffer;
    KivVcs::Helpers::AppendToBuffer(buffer, "8-bit");
    KivVcs::Helpers::AppendToBuffer(buffer, bytes);
    KivVcs::Helpers::AppendToBuffer(buffer, text);
#endif
}
