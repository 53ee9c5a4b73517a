#pragma once
// The Convert bodies of every format, written once: Conversions.h compiles them as processor code and
// Formats.cpp stringifies the same tokens into kernel text. Inside a body, `source` is the pixel being
// converted; the stored-to-working body returns rgbauf_type, the working-to-stored body the stored type.
// Bodies whose text is a fixed contract are spelled exactly so, spacing included.

// clang-format off

#define RT_RGBA8_TO_WORKING return rgbauf_literal(source.x/255.0f,source.y/255.0f,source.z/255.0f,source.w/255.0f);
#define RT_RGBA8_FROM_WORKING return convert_dest(round(clamp(source,0.0f,1.0f)*255.0f));

#define RT_RGBA16_TO_WORKING return rgbauf_literal(source.x/65535.0f,source.y/65535.0f,source.z/65535.0f,source.w/65535.0f);
#define RT_RGBA16_FROM_WORKING return convert_dest(round(clamp(source,0.0f,1.0f)*65535.0f));

#define RT_RGBAUF_TO_WORKING return source;
#define RT_RGBAUF_FROM_WORKING return source;

#define RT_IA8_TO_WORKING return rgbauf_literal(source.x/255.0f,source.x/255.0f,source.x/255.0f,source.y/255.0f);
// The clamp's result is dropped, so the luminance comes from the unclamped working values: fixed behaviour.
#define RT_IA8_FROM_WORKING_1 saturate(source);
#define RT_IA8_FROM_WORKING_2 return convert_uchar2(round(float2_literal(255.0f*(source.x*0.299f+source.y*0.587f+source.z*0.114f), source.w*255.0f)));

#define RT_IA16_TO_WORKING return rgbauf_literal(source.x/65535.0f,source.x/65535.0f,source.x/65535.0f,source.y/65535.0f);
#define RT_IA16_FROM_WORKING_1 saturate(source);
#define RT_IA16_FROM_WORKING_2 return ushort2_literal(round(65535.0f*(source.x*0.299f+source.y*0.587f+source.z*0.114f)),round(source.w*65535.0f));

#define RT_LABA16_TO_WORKING return labaf_to_rgbauf(convert_float4(source)/65535.0f);
#define RT_LABA16_FROM_WORKING return convert_ushort4(rgbauf_to_labaf(source)*65535.0f + 0.5f);

#define RT_MASKA8_TO_WORKING return rgbauf_literal(0.0f,0.0f,0.0f,source/255.0f);
#define RT_MASKA8_FROM_WORKING return convert_dest(round(source.w*255.0f));

#define RT_MASKA16_TO_WORKING return rgbauf_literal(0.0f,0.0f,0.0f,source/65535.0f);
#define RT_MASKA16_FROM_WORKING return convert_dest(round(source.w*65535.0f));

#define RT_MASKAF_TO_WORKING return rgbauf_literal(0.0f,0.0f,0.0f,source);
#define RT_MASKAF_FROM_WORKING return source.w;

// The colour-only pair's way in: colour unscaled, alpha forced to 1.
#define RT_COLOUR_ONLY_TO_WORKING return rgbauf_literal(source.x,source.y,source.z,1.0f);

// clang-format on

// CMYKA8: inks scaled by the single-precision 1/255, undercolour from black; alpha divided by 255.
#define RT_CMYKA8_TO_WORKING                                                                                 \
    const float c = source.cmyk[0] * 0.003921569f;                                                           \
    const float m = source.cmyk[1] * 0.003921569f;                                                           \
    const float y = source.cmyk[2] * 0.003921569f;                                                           \
    const float k = source.cmyk[3] * 0.003921569f;                                                           \
    return rgbauf_literal(1.0f - rt_fmin(1.0f, c * (1.0f - k) + k),                                          \
                          1.0f - rt_fmin(1.0f, m * (1.0f - k) + k),                                          \
                          1.0f - rt_fmin(1.0f, y * (1.0f - k) + k), source.a / 255.0f);

// Clamped first; black takes what the three inks share. Where black stores as full (k * 255 rounds to 255)
// the inks could change the colour by less than half a step, and dividing by 1 - k would blow a float
// residue near black up into full inks: they are left at 0, and pure black needs no division.
#define RT_CMYKA8_FROM_WORKING                                                                               \
    source = saturate(source);                                                                               \
    const float k = rt_fmin(1.0f - source.x, rt_fmin(1.0f - source.y, 1.0f - source.z));                     \
    float c = 0.0f;                                                                                          \
    float m = 0.0f;                                                                                          \
    float y = 0.0f;                                                                                          \
    if (k * 255.0f < 254.5f) {                                                                               \
        c = (1.0f - source.x - k) / (1.0f - k);                                                              \
        m = (1.0f - source.y - k) / (1.0f - k);                                                              \
        y = (1.0f - source.z - k) / (1.0f - k);                                                              \
    }                                                                                                        \
    return rt_make_cmyka8((uchar)rt_round(c * 255.0f), (uchar)rt_round(m * 255.0f),                          \
                          (uchar)rt_round(y * 255.0f), (uchar)rt_round(k * 255.0f),                          \
                          (uchar)rt_round(source.w * 255.0f));

// The colour-only pair's way out: x, y and z go into a fresh pixel whose alpha is left unset (the colour-only
// channel write keeps the destination's).
#define RT_COLOUR_ONLY_FROM_WORKING                                                                          \
    dest_type result;                                                                                        \
    result.x = source.x;                                                                                     \
    result.y = source.y;                                                                                     \
    result.z = source.z;                                                                                     \
    return result;
