#include "host/brush/RasterBrush.h"

#include <algorithm>
#include <cmath>
#include <cstring>

namespace Raster {

const Kernel::ClassProperties SquareRasterBrush::ms_ClassProperties(Kernel::MakeFourCC("SqBr"),
                                                                    &SquareRasterBrush::CreateObject, 1,
                                                                    nullptr, nullptr);

namespace {

int MaskIndex(PixelFormat format) noexcept {
    switch (format) {
    case PixelFormat::MaskA8:
        return 0;
    case PixelFormat::MaskA16:
        return 1;
    case PixelFormat::MaskAF:
        return 2;
    default:
        return -1;
    }
}

// A mask value as a fraction 0..1 (NaN counts as 0).
double ReadMask(const DynamicBuffer& image, int x, int y) noexcept {
    switch (image.GetFormat()) {
    case PixelFormat::MaskA8:
        return image.Row<std::uint8_t>(y)[x] / 255.0;
    case PixelFormat::MaskA16:
        return image.Row<std::uint16_t>(y)[x] / 65535.0;
    default: {
        const float v = image.Row<float>(y)[x];
        return std::isnan(v) ? 0.0 : std::clamp(double(v), 0.0, 1.0);
    }
    }
}

void WriteMask(DynamicBuffer& image, int x, int y, double fraction) noexcept {
    switch (image.GetFormat()) {
    case PixelFormat::MaskA8:
        image.Row<std::uint8_t>(y)[x] = std::uint8_t(std::lround(fraction * 255.0));
        break;
    case PixelFormat::MaskA16:
        image.Row<std::uint16_t>(y)[x] = std::uint16_t(std::lround(fraction * 65535.0));
        break;
    default:
        image.Row<float>(y)[x] = float(fraction);
        break;
    }
}

} // namespace

double MaskFullValue(PixelFormat format) noexcept {
    switch (format) {
    case PixelFormat::MaskA8:
        return 255.0;
    case PixelFormat::MaskA16:
        return 65535.0;
    default:
        return 1.0;
    }
}

bool BrushNozzle::SameDab(const BrushNozzle& o) const noexcept {
    return rect == o.rect && opacity == o.opacity && strength == o.strength && mode == o.mode &&
           param == o.param && hueOffset == o.hueOffset && saturationOffset == o.saturationOffset &&
           lightnessOffset == o.lightnessOffset && pressure == o.pressure;
}

void BrushDynamic::SetValue(double value) noexcept {
    if (!std::isnan(value)) m_Value = std::clamp(value, 0.0, 1.0);
}

void BrushDynamic::SetInfluence(double influence) noexcept {
    if (!std::isnan(influence)) m_Influence = std::clamp(influence, 0.0, 1.0);
}

double BrushDynamic::GetValue(double pressure) const noexcept {
    pressure = std::isnan(pressure) ? 1.0 : std::clamp(pressure, 0.0, 1.0);
    return m_Value * (1.0 - m_Influence + m_Influence * pressure);
}

RasterBrush::RasterBrush(const RasterBrush& other)
    : Kernel::Countable()
    , Kernel::Serialisable()
    , m_Size(other.m_Size)
    , m_Spacing(other.m_Spacing)
    , m_TextureMode(other.m_TextureMode)
    , m_TextureScale(other.m_TextureScale)
    , m_Texture(other.m_Texture)
    , m_CoverageFormat(other.m_CoverageFormat)
    , m_CoverageOnly(other.m_CoverageOnly) {
    for (int i = 0; i < kDynamicCount; ++i)
        m_Dynamics[i] = other.m_Dynamics[i];
}

void RasterBrush::SetSize(double size) noexcept {
    if (!std::isnan(size)) m_Size = std::clamp(size, kMinimumSize, kMaximumSize);
}

void RasterBrush::SetSpacing(double spacing) noexcept {
    if (!std::isnan(spacing)) m_Spacing = std::clamp(spacing, 0.01, 10.0);
}

const BrushDynamic* RasterBrush::GetActiveDynamic() const noexcept {
    for (const auto& dynamic : m_Dynamics)
        if (dynamic.IsActive()) return &dynamic;
    return nullptr;
}

void RasterBrush::SetMaskTextureScale(double scale) noexcept {
    if (!std::isnan(scale)) m_TextureScale = std::clamp(scale, 1.0 / 64.0, 64.0);
}

bool RasterBrush::SetMaskTexture(Kernel::Counted<DynamicBuffer> texture) {
    if (texture && (!IsMaskFormat(texture->GetFormat()) || texture->GetWidth() > kMaximumTextureSide ||
                    texture->GetHeight() > kMaximumTextureSide))
        return false;
    std::lock_guard lock(m_TextureMutex);
    m_Texture = std::move(texture);
    for (auto& cached : m_TextureCache)
        cached = {};
    return true;
}

Kernel::Counted<DynamicBuffer> RasterBrush::GetMaskTexture(PixelFormat format) const {
    const int index = MaskIndex(format);
    std::lock_guard lock(m_TextureMutex);
    if (!m_Texture || index < 0) return {};
    if (m_Texture->GetFormat() == format) return m_Texture;
    if (!m_TextureCache[index]) {
        auto converted = DynamicBuffer::Create(m_Texture->GetWidth(), m_Texture->GetHeight(), format);
        if (!converted) return {};
        for (int y = 0; y < converted->GetHeight(); ++y)
            for (int x = 0; x < converted->GetWidth(); ++x)
                WriteMask(*converted, x, y, ReadMask(*m_Texture, x, y));
        m_TextureCache[index] = std::move(converted);
    }
    return m_TextureCache[index];
}

void RasterBrush::SetCoverageFormat(PixelFormat format) noexcept {
    if (MaskIndex(format) >= 0) m_CoverageFormat = format;
}

namespace {
constexpr Kernel::FourCC kSize = Kernel::MakeFourCC("Size");
constexpr Kernel::FourCC kSpacing = Kernel::MakeFourCC("Spac");
constexpr Kernel::FourCC kDynamicActive[2] = {Kernel::MakeFourCC("DyA0"), Kernel::MakeFourCC("DyA1")};
constexpr Kernel::FourCC kDynamicValue[2] = {Kernel::MakeFourCC("DyV0"), Kernel::MakeFourCC("DyV1")};
constexpr Kernel::FourCC kDynamicInfluence[2] = {Kernel::MakeFourCC("DyI0"), Kernel::MakeFourCC("DyI1")};
constexpr Kernel::FourCC kTextureMode = Kernel::MakeFourCC("TxMd");
constexpr Kernel::FourCC kTextureScale = Kernel::MakeFourCC("TxSc");
constexpr Kernel::FourCC kTextureFormat = Kernel::MakeFourCC("TxFm");
constexpr Kernel::FourCC kTextureWidth = Kernel::MakeFourCC("TxWd");
constexpr Kernel::FourCC kTextureHeight = Kernel::MakeFourCC("TxHt");
constexpr Kernel::FourCC kTexturePixels = Kernel::MakeFourCC("TxPx");
constexpr Kernel::FourCC kCoverageFormat = Kernel::MakeFourCC("CvFm");
constexpr Kernel::FourCC kCoverageOnly = Kernel::MakeFourCC("CvOn");
} // namespace

void RasterBrush::Save(Kernel::OutSerialiser& out) const {
    out.SaveType(kSize, m_Size);
    out.SaveType(kSpacing, m_Spacing);
    for (int i = 0; i < kDynamicCount; ++i) {
        out.SaveType(kDynamicActive[i], m_Dynamics[i].IsActive());
        out.SaveType(kDynamicValue[i], m_Dynamics[i].GetBaseValue());
        out.SaveType(kDynamicInfluence[i], m_Dynamics[i].GetInfluence());
    }
    out.SaveType(kTextureMode, std::int32_t(m_TextureMode));
    out.SaveType(kTextureScale, m_TextureScale);
    out.SaveType(kCoverageFormat, std::uint32_t(m_CoverageFormat));
    out.SaveType(kCoverageOnly, m_CoverageOnly);
    std::lock_guard lock(m_TextureMutex);
    if (m_Texture) {
        out.SaveType(kTextureFormat, std::uint32_t(m_Texture->GetFormat()));
        out.SaveType(kTextureWidth, std::int32_t(m_Texture->GetWidth()));
        out.SaveType(kTextureHeight, std::int32_t(m_Texture->GetHeight()));
        std::vector<std::byte> bytes;
        bytes.reserve(m_Texture->GetRowBytes() * std::size_t(m_Texture->GetHeight()));
        for (int y = 0; y < m_Texture->GetHeight(); ++y)
            bytes.insert(bytes.end(), m_Texture->RowBytes(y),
                         m_Texture->RowBytes(y) + m_Texture->GetRowBytes());
        out.SaveArray(kTexturePixels, bytes);
    }
}

bool RasterBrush::Load(const Kernel::InSerialiser& in, Kernel::FileStore& store, unsigned short version) {
    (void)store;
    (void)version;
    double size = m_Size, spacing = m_Spacing, scale = m_TextureScale;
    in.LoadType(kSize, size);
    in.LoadType(kSpacing, spacing);
    SetSize(size);
    SetSpacing(spacing);
    for (int i = 0; i < kDynamicCount; ++i) {
        bool active = m_Dynamics[i].IsActive();
        double value = m_Dynamics[i].GetBaseValue(), influence = m_Dynamics[i].GetInfluence();
        in.LoadType(kDynamicActive[i], active);
        in.LoadType(kDynamicValue[i], value);
        in.LoadType(kDynamicInfluence[i], influence);
        m_Dynamics[i].SetActive(active);
        m_Dynamics[i].SetValue(value);
        m_Dynamics[i].SetInfluence(influence);
    }
    std::int32_t mode = m_TextureMode;
    in.LoadType(kTextureMode, mode);
    m_TextureMode = mode;
    in.LoadType(kTextureScale, scale);
    SetMaskTextureScale(scale);
    std::uint32_t coverage = std::uint32_t(m_CoverageFormat);
    in.LoadType(kCoverageFormat, coverage);
    if (coverage < std::uint32_t(PixelFormatCount)) SetCoverageFormat(PixelFormat(coverage));
    in.LoadType(kCoverageOnly, m_CoverageOnly);
    if (in.Has(kTexturePixels)) {
        std::uint32_t format = 0;
        std::int32_t width = 0, height = 0;
        std::vector<std::byte> bytes;
        if (!in.LoadType(kTextureFormat, format) || !in.LoadType(kTextureWidth, width) ||
            !in.LoadType(kTextureHeight, height) || !in.LoadArray(kTexturePixels, bytes))
            return false;
        if (format >= std::uint32_t(PixelFormatCount) || !IsMaskFormat(PixelFormat(format)) || width < 1 ||
            height < 1 || width > kMaximumTextureSide || height > kMaximumTextureSide ||
            bytes.size() !=
                std::size_t(width) * std::size_t(height) * std::size_t(GetBytesPerPixel(PixelFormat(format))))
            return false;
        auto texture = DynamicBuffer::Create(width, height, PixelFormat(format));
        if (!texture) return false;
        for (int y = 0; y < height; ++y)
            std::memcpy(texture->RowBytes(y), bytes.data() + std::size_t(y) * texture->GetRowBytes(),
                        texture->GetRowBytes());
        SetMaskTexture(std::move(texture));
    }
    return true;
}

Kernel::Counted<DynamicBuffer> SquareRasterBrush::MakeCoverage(Kernel::RectT<int> rect) const {
    if (rect.IsEmpty()) return {};
    auto coverage = DynamicBuffer::Create(rect.Width(), rect.Height(), GetCoverageFormat());
    if (!coverage) return coverage;
    for (int y = 0; y < coverage->GetHeight(); ++y)
        for (int x = 0; x < coverage->GetWidth(); ++x)
            WriteMask(*coverage, x, y, 1.0);
    return coverage;
}

Kernel::Counted<RasterBrush> SquareRasterBrush::Copy() const {
    return Kernel::Counted<RasterBrush>(new SquareRasterBrush(*this));
}

} // namespace Raster
