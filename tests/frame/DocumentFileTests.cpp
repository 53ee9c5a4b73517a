// Documents on disk: round trips with layers, live filters, selection and history; damaged files refused.

#include "filters/tonal/RasterAddNoiseCommand.h"
#include "filters/tonal/RasterDiffuseCommand.h"
#include "filters/tonal/RasterUnsharpMaskCommand.h"
#include "host/document/DocumentFile.h"
#include "tests/frame/FrameTestSupport.h"

#include <cstring>
#include <fstream>

using namespace RasterTools;
using RasterToolsTest::EditorFixture;

namespace {

// 64-bit FNV-1a, the file's checksum, so that tests can forge a consistent but hostile file.
std::uint64_t Fnv1a(std::span<const std::byte> bytes) {
    std::uint64_t hash = 0xcbf29ce484222325ull;
    for (std::byte b : bytes)
        hash = (hash ^ std::uint64_t(b)) * 0x100000001b3ull;
    return hash;
}

void Reseal(std::vector<std::byte>& file) {
    const std::uint64_t sum = Fnv1a(std::span(file).first(file.size() - 8));
    std::memcpy(file.data() + file.size() - 8, &sum, 8);
}

std::string Describe(const Document& document) {
    std::string text;
    for (const auto& node : document.GetLayers()) {
        text += node->GetKindName() + ":" + node->GetName();
        if (auto* live = dynamic_cast<const FilterRasterNode*>(node.Get()))
            text += "[" + DescribeCommand(*live->GetFilter()) + "]";
        text += ";";
    }
    text += " selected:";
    for (const auto& node : document.GetSelection())
        text += std::to_string(document.IndexOf(*node)) + ",";
    text += " history:";
    for (const auto& entry : document.GetHistory())
        text += DescribeCommand(*entry.command) + "|";
    return text + " cursor:" + std::to_string(document.GetHistoryCursor());
}

} // namespace

class DocumentFiles : public EditorFixture {
protected:
    // Pixel edit, two live layers, an edited filter and one undone step.
    void BuildHistory() {
        m_Controller->EnqueueCommand(
            Kernel::Counted<Command>(new RasterUnsharpMaskCommand(false, 3, 1.5, 0.1)), false);
        m_Noise = AddLiveLayer(Kernel::Counted<Command>(new RasterAddNoiseCommand(true, 0.25, true, false)));
        m_Diffuse = AddLiveLayer(Kernel::Counted<Command>(new RasterDiffuseCommand(true, 0.125)));
        m_Controller->BeginLiveEffectEdit(m_Noise);
        m_Controller->EnqueueCommand(Kernel::Counted<Command>(new RasterDiffuseCommand(false, 0.5)), false);
        m_Controller->SetSelection({Kernel::Counted<Node>(m_Noise)});
        m_Controller->EnqueueCommand(
            Kernel::Counted<Command>(new RasterAddNoiseCommand(true, 0.75, false, true)), false);
        m_Controller->Undo();
    }
    Kernel::Counted<FilterRasterNode> m_Noise, m_Diffuse;
};

TEST_F(DocumentFiles, RoundTripKeepsLayersSelectionAndHistory) {
    BuildHistory();
    const std::string before = Describe(*m_Document);
    const auto path =
        std::filesystem::temp_directory_path() / ("rastertools-doc-" + std::to_string(::getpid()) + ".rtd");
    ASSERT_FALSE(DocumentFile::Save(*m_Document, path));
    Kernel::Counted<Document> loaded;
    ASSERT_FALSE(DocumentFile::Load(path, loaded));
    std::filesystem::remove(path);
    EXPECT_EQ(Describe(*loaded), before);

    // The loaded history still works: redo the undone edit, then undo everything back to the background.
    ASSERT_TRUE(loaded->Redo());
    // Each new live layer went above the selected background, so the later one sits lower.
    ASSERT_EQ(loaded->GetLayers().size(), 3u);
    auto node = Kernel::CountedCast<FilterRasterNode>(loaded->GetLayer(2));
    ASSERT_TRUE(node);
    auto filter = Kernel::CountedCast<RasterAddNoiseCommand>(node->GetFilter());
    ASSERT_TRUE(filter);
    EXPECT_DOUBLE_EQ(filter->GetIntensity(), 0.75);
    while (loaded->Undo()) {
    }
    ASSERT_EQ(loaded->GetLayers().size(), 1u);
    EXPECT_EQ(loaded->GetLayer(0)->GetName(), "Background");
    // Redo brings back the very same layer objects that undo removed.
    while (loaded->Redo()) {
    }
    EXPECT_EQ(loaded->GetLayers().size(), 3u);
}

TEST_F(DocumentFiles, DamagedOrTruncatedFilesAreRefused) {
    BuildHistory();
    const auto bytes = DocumentFile::Encode(*m_Document);
    ASSERT_FALSE(bytes.empty());
    Kernel::Counted<Document> loaded;
    for (std::size_t length = 0; length < bytes.size(); ++length)
        EXPECT_TRUE(DocumentFile::Decode(std::span(bytes).first(length), loaded)) << "length " << length;
    for (std::size_t at = 0; at < bytes.size(); at += 7) {
        auto damaged = bytes;
        damaged[at] ^= std::byte(0x20);
        EXPECT_TRUE(DocumentFile::Decode(damaged, loaded)) << "byte " << at;
    }
    EXPECT_FALSE(loaded);
}

TEST_F(DocumentFiles, HostileCountsWithAValidChecksumAreRefused) {
    const auto bytes = DocumentFile::Encode(*m_Document);
    // Magic (8) and version (4), then the layer counts.
    for (std::uint32_t count : {0xFFFFFFFFu, 0x10000000u, 2u}) {
        auto forged = bytes;
        std::memcpy(forged.data() + 12, &count, 4);
        Reseal(forged);
        Kernel::Counted<Document> loaded;
        const auto error = DocumentFile::Decode(forged, loaded);
        ASSERT_TRUE(error) << count;
        EXPECT_NE(error->find("damaged"), std::string::npos) << *error;
    }
    auto future = bytes;
    const std::uint32_t version = 99;
    std::memcpy(future.data() + 8, &version, 4);
    Reseal(future);
    Kernel::Counted<Document> loaded;
    EXPECT_EQ(DocumentFile::Decode(future, loaded).value_or(""),
              "document version 99 is from a newer rastertools and cannot be read (this program reads "
              "versions 2 to "
              "4)");
}

TEST_F(DocumentFiles, AFailedLoadLeavesTheFileAndAFailedSaveLeavesTheOldFile) {
    const auto path =
        std::filesystem::temp_directory_path() / ("rastertools-bad-" + std::to_string(::getpid()) + ".rtd");
    {
        std::ofstream out(path, std::ios::binary);
        out << "RTDOC but not really";
    }
    Kernel::Counted<Document> loaded;
    const auto error = DocumentFile::Load(path, loaded);
    ASSERT_TRUE(error);
    EXPECT_NE(error->find(path.string()), std::string::npos);
    EXPECT_EQ(std::filesystem::file_size(path), 20u);

    // Saving into a folder that does not exist fails and names the file.
    const auto nowhere = path.parent_path() / "no-such-folder" / "x.rtd";
    const auto saveError = DocumentFile::Save(*m_Document, nowhere);
    ASSERT_TRUE(saveError);
    EXPECT_NE(saveError->find("x.rtd"), std::string::npos);
    std::filesystem::remove(path);
    EXPECT_TRUE(DocumentFile::Load(path, loaded));
}
