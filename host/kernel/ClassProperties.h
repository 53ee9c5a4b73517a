#pragma once
// The class registry: creates serialisable objects from their class codes.

#include "host/kernel/Countable.h"
#include "host/kernel/FourCC.h"
// CreateObject() below returns (and so destroys) a Counted<Serialisable>, which needs the complete class.
#include "host/kernel/Serialiser.h"

#include <vector>

namespace Kernel {

class Serialisable;

class ClassPropertiesBase {
public:
    // A default value for one serialised property; a default-constructed item means no defaults.
    struct DefaultItem {
        FourCC code = 0;
        double value = 0.0;
    };
};

// Identity of a serialisable class. Constructing one registers the class under its code.
class ClassProperties : public ClassPropertiesBase {
public:
    using Factory = Counted<Serialisable> (*)();

    // defaults points at an array that ends with a default-constructed item (or is null).
    ClassProperties(FourCC classCode, Factory factory, unsigned short version, const DefaultItem* defaults,
                    const ClassProperties* base);
    ~ClassProperties();
    ClassProperties(const ClassProperties&) = delete;
    ClassProperties& operator=(const ClassProperties&) = delete;

    FourCC GetClassCode() const noexcept { return m_ClassCode; }
    unsigned short GetVersion() const noexcept { return m_Version; }
    const ClassProperties* GetBase() const noexcept { return m_Base; }
    const DefaultItem* GetDefaults() const noexcept { return m_Defaults; }
    Counted<Serialisable> CreateObject() const { return m_Factory ? m_Factory() : Counted<Serialisable>(); }
    // True when this class is other or derives from it.
    bool IsKindOf(const ClassProperties& other) const noexcept;

    static const ClassProperties* Find(FourCC classCode);
    static std::vector<const ClassProperties*> GetRegistered();

private:
    FourCC m_ClassCode;
    Factory m_Factory;
    unsigned short m_Version;
    const DefaultItem* m_Defaults;
    const ClassProperties* m_Base;
};

} // namespace Kernel
