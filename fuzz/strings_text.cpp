// The reader of strings files: a section, a key, and the text of a file. Reading line by line has
// to give the same answer as the search for sections, in memory and through a file.

#include <strings_file.h>

#include <vector>

#include "input.h"
#include "strings/strings_text.h"

namespace {

namespace text = host::strings_text;

struct Plain {
    std::vector<std::string> sections;
    std::optional<std::string> value;
};

Plain ReadPlainly(std::string_view all, std::string_view section, std::string_view key) {
    Plain plain;
    bool blInside = false;
    for (std::size_t begin = 0; begin < all.size();) {
        const std::string_view line = text::LineAt(all, begin);
        if (const auto name = text::SectionName(line)) {
            plain.sections.emplace_back(*name);
            blInside = *name == section;
        } else if (blInside && !plain.value) {
            plain.value = text::FindKey(line, key);
        }
        begin += line.size() + 1;
    }
    return plain;
}

void CheckFile(std::string_view all, const std::string &strSection, const std::string &strKey,
               const std::optional<std::string> &value) {
    static const fuzz::InputFile file;
    constexpr int kSize = 16;
    constexpr int kLongestCharacter = 4;
    file.Write(all);
    std::vector<char> out(kSize, '?');
    const int cb = YLIBCFileGetSectionValue(file.Path(), strSection.c_str(), strKey.c_str(),
                                            out.data(), kSize);
    FUZZ_EXPECT((cb >= 0) == value.has_value());
    if (value) {
        FUZZ_EXPECT(value->compare(0, static_cast<std::size_t>(cb), out.data()) == 0);
        FUZZ_EXPECT(static_cast<std::size_t>(cb) == value->size() ||
                    cb >= kSize - 1 - kLongestCharacter);
    }
}

}  // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t *pData, std::size_t cb) {
    std::string_view input = fuzz::Input(pData, cb);
    const std::string strSection = fuzz::TakePart(input);
    const std::string strKey = fuzz::TakePart(input);
    const Plain plain = ReadPlainly(input, strSection, strKey);
    std::vector<std::string> sections;
    for (auto section = text::NextSection(input, 0); section;
         section = text::NextSection(input, section->end)) {
        sections.emplace_back(section->name);
    }
    FUZZ_EXPECT(sections == plain.sections);
    CheckFile(input, strSection, strKey, plain.value);
    return 0;
}
