#pragma once
// Identifiers the host gives its tools; a filter tool and its command share one.

enum class ToolID : int {
    None = 0,
    Pixel = 41,
    Twirl = 53,
    AddNoise = 55,
    Diffuse = 56,
    Sphere = 60,
    LensBlur = 62,
    DiffuseGlow = 65,
    MotionBlur = 68,
    RadialBlur = 70,
    UnsharpMask = 81,
    DepthOfField = 84,
    FieldBlur = 153,
    Lighting = 161,
    ZMapBlur = 164,
    ProceduralTexture = 205,
    Voronoi = 230,
};
