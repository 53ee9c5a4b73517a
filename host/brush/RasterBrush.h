#pragma once
// Brushes as the host's brush engine uses them: the dab shape and its dynamics (RasterBrush,
// SquareRasterBrush), and the record of one dab (BrushNozzle).

#include "host/kernel/ClassProperties.h"
#include "host/kernel/Countable.h"
#include "host/kernel/Geometry.h"
#include "host/kernel/Serialiser.h"
#include "host/raster/DynamicBuffer.h"

#include <cstdint>
#include <mutex>

namespace Raster {

// One dab of a stroke: where it lands and how strongly, and, once a command runs it, what it paints into.
struct BrushNozzle {
    // What the dab changes: a layer's pixels, else a mask; set when a command runs the nozzle.
    Kernel::Counted<DynamicBuffer> bitmap;
    Kernel::Counted<DynamicBuffer> mask;
    // The dab's pixels in document coordinates (whole pixels in pixel mode).
    Kernel::RectT<double> rect;
    float opacity = 1.0f;
    float strength = 1.0f;
    int mode = 0;  // 0 paints, 1 stamps; other values paint nothing
    int param = 0; // handed through to the composition
    float hueOffset = 0.0f;
    float saturationOffset = 0.0f;
    float lightnessOffset = 0.0f;
    float pressure = 1.0f; // 0..1, what the brush dynamic reads
    // The dab's coverage (its shape), the size of rect rounded, in a mask format; set with the target.
    Kernel::Counted<DynamicBuffer> coverage;
    // Where the target's pixel (0, 0) sits in document coordinates, for textures and selections.
    Kernel::PointT<int> targetOrigin;
    // For restoring dabs: the pixels to copy back, the size of the rounded, clipped rect in target pixels.
    Kernel::Counted<DynamicBuffer> source;

    // The fields that define the dab (not its target), so that strokes can be compared and saved.
    bool SameDab(const BrushNozzle& other) const noexcept;
};

// Scales a dab by the stroke's pressure: value × (1 − influence + influence × pressure).
class BrushDynamic {
public:
    bool IsActive() const noexcept { return m_Active; }
    void SetActive(bool active) noexcept { m_Active = active; }
    double GetBaseValue() const noexcept { return m_Value; }
    void SetValue(double value) noexcept;
    double GetInfluence() const noexcept { return m_Influence; }
    void SetInfluence(double influence) noexcept;
    // The dab's factor at this pressure, 0..1.
    double GetValue(double pressure) const noexcept;

private:
    bool m_Active = false;
    double m_Value = 1.0;
    double m_Influence = 1.0;
};

// What a brush is: its size, spacing, dynamics and mask texture. Subclasses give the dab's shape.
class RasterBrush : public virtual Kernel::Countable, public Kernel::Serialisable {
public:
    static constexpr double kMinimumSize = 1.0;
    static constexpr double kMaximumSize = 4096.0;
    static constexpr int kMaximumTextureSide = 4096;

    double GetSize() const noexcept { return m_Size; }
    // Clamped to 1..4096; NaN leaves the size as it was.
    void SetSize(double size) noexcept;
    // Distance between dabs outside pixel mode, as a fraction of the size.
    double GetSpacing() const noexcept { return m_Spacing; }
    void SetSpacing(double spacing) noexcept;

    // Dynamics: 0 scales the dab by pressure; the others are kept for the host's own brushes.
    static constexpr int kDynamicCount = 2;
    BrushDynamic& GetDynamic(int index) { return m_Dynamics[std::size_t(index) % kDynamicCount]; }
    const BrushDynamic& GetDynamic(int index) const { return m_Dynamics[std::size_t(index) % kDynamicCount]; }
    // The dynamic that scales dabs, or null when none is active.
    const BrushDynamic* GetActiveDynamic() const noexcept;

    // The mask texture: mode 1 multiplies every dab by the texture, repeated over the document at the
    // texture scale; mode 0 leaves it unused.
    int GetMaskTextureMode() const noexcept { return m_TextureMode; }
    void SetMaskTextureMode(int mode) noexcept { m_TextureMode = mode; }
    double GetMaskTextureScale() const noexcept { return m_TextureScale; }
    // Clamped to 1/64..64; NaN leaves the scale as it was.
    void SetMaskTextureScale(double scale) noexcept;
    // Any mask-format image up to kMaximumTextureSide a side (else refused: false); null removes it.
    bool SetMaskTexture(Kernel::Counted<DynamicBuffer> texture);
    // The texture in a mask format (converted once and kept); null without a texture or for a non-mask
    // format.
    Kernel::Counted<DynamicBuffer> GetMaskTexture(PixelFormat format) const;

    // The format of the coverage masks the brush hands out (a mask format).
    PixelFormat GetCoverageFormat() const noexcept { return m_CoverageFormat; }
    void SetCoverageFormat(PixelFormat format) noexcept;
    // Whether the brush only marks coverage (it paints full intensity into a mask, never colour).
    bool IsCoverageOnly() const noexcept { return m_CoverageOnly; }
    void SetCoverageOnly(bool coverageOnly) noexcept { m_CoverageOnly = coverageOnly; }
    // Whether the brush can paint at all: false without a usable shape.
    virtual bool CanPaint() const noexcept { return m_Size >= kMinimumSize; }

    // The dab's coverage over rect (whole pixels), in the coverage format; null when it cannot be made.
    virtual Kernel::Counted<DynamicBuffer> MakeCoverage(Kernel::RectT<int> rect) const = 0;
    virtual Kernel::Counted<RasterBrush> Copy() const = 0;

    void Save(Kernel::OutSerialiser& out) const override;
    bool Load(const Kernel::InSerialiser& in, Kernel::FileStore& store, unsigned short version) override;

protected:
    RasterBrush() = default;
    RasterBrush(const RasterBrush& other);
    RasterBrush& operator=(const RasterBrush&) = delete;

private:
    double m_Size = 1.0;
    double m_Spacing = 0.25;
    BrushDynamic m_Dynamics[kDynamicCount];
    int m_TextureMode = 0;
    double m_TextureScale = 1.0;
    Kernel::Counted<DynamicBuffer> m_Texture;
    PixelFormat m_CoverageFormat = PixelFormat::MaskA8;
    bool m_CoverageOnly = false;
    mutable std::mutex m_TextureMutex;
    mutable Kernel::Counted<DynamicBuffer> m_TextureCache[3];
};

// A square brush with a hard edge: every pixel of the dab is fully covered.
class SquareRasterBrush final : public RasterBrush {
public:
    SquareRasterBrush() = default;
    static Kernel::Counted<Kernel::Serialisable> CreateObject() {
        return Kernel::MakeCounted<SquareRasterBrush>();
    }
    static const Kernel::ClassProperties& GetTypeClassProperties() { return ms_ClassProperties; }
    const Kernel::ClassProperties& GetObjectClassProperties() const override { return ms_ClassProperties; }

    Kernel::Counted<DynamicBuffer> MakeCoverage(Kernel::RectT<int> rect) const override;
    Kernel::Counted<RasterBrush> Copy() const override;

private:
    SquareRasterBrush(const SquareRasterBrush& other) = default;
    static const Kernel::ClassProperties ms_ClassProperties;
};

// The full value of a mask format's component: 255, 65535 or 1.
double MaskFullValue(PixelFormat format) noexcept;

} // namespace Raster
