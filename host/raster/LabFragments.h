#pragma once
// Kernel text of the Lab conversions labaf_to_rgbauf and rgbauf_to_labaf, pasted in by the LabA16 traits.

namespace Raster {

// The text defining, for kernel language 1 (OpenCL C) or 0 (C++ for NVRTC, over CUDA's float4):
//   float4 labaf_to_rgbauf(float4 lab)  L, a, b, alpha as stored / 65535  ->  working r, g, b, alpha
//   float4 rgbauf_to_labaf(float4 rgb)  the reverse, every component clamped to 0..1 (NaN to 0)
// made of LabMath.h's source, the one the colour manager (ICCManager) compiles, so that both give the same
// bits. Helper names start with rt_lab_. It needs nothing from other fragments: in language 0 only float4,
// make_float4, __float_as_int and __int_as_float, which CUDA supplies. Null for any other language; the text
// lives until the process ends.
const char* GetLabConversionFragment(int language);

} // namespace Raster
