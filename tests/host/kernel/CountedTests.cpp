#include "host/kernel/Countable.h"
#include "host/kernel/Notification.h"

#include <gtest/gtest.h>

#include <atomic>
#include <thread>
#include <vector>

using namespace Kernel;

namespace {

std::atomic<int> g_Destroyed{0};

class Animal : public virtual Countable {
public:
    ~Animal() override { g_Destroyed.fetch_add(1); }
    virtual int Legs() const { return 0; }
};

class Dog : public Animal {
public:
    int Legs() const override { return 4; }
};

class Rock : public virtual Countable {};

} // namespace

TEST(Counted, RetainAndReleaseCounts) {
    const long live = Countable::GetLiveObjectCount();
    const int destroyed = g_Destroyed.load();
    {
        Counted<Dog> a = MakeCounted<Dog>();
        EXPECT_EQ(a->GetReferenceCount(), 1);
        EXPECT_EQ(Countable::GetLiveObjectCount(), live + 1);
        {
            Counted<Dog> b = a;
            EXPECT_EQ(a->GetReferenceCount(), 2);
            EXPECT_TRUE(a == b);
            Counted<Dog> c = std::move(b);
            EXPECT_EQ(a->GetReferenceCount(), 2);
            EXPECT_FALSE(b);
            EXPECT_TRUE(b == nullptr);
            EXPECT_TRUE(nullptr == b);
            c.Reset();
            EXPECT_EQ(a->GetReferenceCount(), 1);
            Counted<Dog> d;
            d = a;
            EXPECT_EQ(a->GetReferenceCount(), 2);
            Counted<Dog>& alias = d;
            d = alias; // self-assignment keeps the count
            EXPECT_EQ(a->GetReferenceCount(), 2);
        }
        EXPECT_EQ(a->GetReferenceCount(), 1);
        EXPECT_EQ(g_Destroyed.load(), destroyed);
    }
    EXPECT_EQ(g_Destroyed.load(), destroyed + 1);
    EXPECT_EQ(Countable::GetLiveObjectCount(), live);
}

TEST(Counted, ConversionToBase) {
    const long live = Countable::GetLiveObjectCount();
    {
        Counted<Dog> dog = MakeCounted<Dog>();
        Counted<Animal> animal = dog;
        EXPECT_EQ(dog->GetReferenceCount(), 2);
        EXPECT_EQ(animal->Legs(), 4);
        EXPECT_EQ(animal.Get(), static_cast<Animal*>(dog.Get()));

        Counted<Countable> countable = animal;
        EXPECT_EQ(dog->GetReferenceCount(), 3);

        Counted<Animal> moved = std::move(dog); // converting move: no retain
        EXPECT_FALSE(dog);
        EXPECT_EQ(moved->GetReferenceCount(), 3);

        static_assert(std::is_convertible_v<Counted<Dog>, Counted<Animal>>);
        static_assert(!std::is_convertible_v<Counted<Animal>, Counted<Dog>>);
        static_assert(!std::is_convertible_v<Counted<Rock>, Counted<Animal>>);
    }
    EXPECT_EQ(Countable::GetLiveObjectCount(), live);
}

TEST(Counted, CountedCast) {
    const long live = Countable::GetLiveObjectCount();
    {
        Counted<Animal> animal = MakeCounted<Dog>();
        Counted<Dog> dog = CountedCast<Dog>(animal);
        ASSERT_TRUE(dog);
        EXPECT_EQ(dog->GetReferenceCount(), 2);

        Counted<Rock> rock = CountedCast<Rock>(animal);
        EXPECT_FALSE(rock);
        EXPECT_EQ(animal->GetReferenceCount(), 2);

        Counted<Animal> plain = MakeCounted<Animal>();
        EXPECT_FALSE(CountedCast<Dog>(plain));
        EXPECT_EQ(plain->GetReferenceCount(), 1);

        EXPECT_FALSE(CountedCast<Dog>(Counted<Animal>()));
    }
    EXPECT_EQ(Countable::GetLiveObjectCount(), live);
}

TEST(Counted, DetachAndAdopt) {
    const long live = Countable::GetLiveObjectCount();
    Counted<Dog> dog = MakeCounted<Dog>();
    Dog* raw = dog.Detach();
    EXPECT_FALSE(dog);
    EXPECT_EQ(raw->GetReferenceCount(), 1);
    {
        Counted<Dog> again(raw); // retains: two references now, one of them the detached one
        EXPECT_EQ(raw->GetReferenceCount(), 2);
    }
    EXPECT_EQ(raw->GetReferenceCount(), 1);
    raw->Release();
    EXPECT_EQ(Countable::GetLiveObjectCount(), live);
}

TEST(NonCounted, DoesNotRetain) {
    Counted<Dog> dog = MakeCounted<Dog>();
    NonCounted<Animal> weak = dog;
    NonCounted<Dog> weakDog = dog.Get();
    EXPECT_EQ(dog->GetReferenceCount(), 1);
    EXPECT_EQ(weak->Legs(), 4);
    EXPECT_TRUE(weakDog == NonCounted<Dog>(dog));
    EXPECT_FALSE(NonCounted<Dog>());
    EXPECT_TRUE(NonCounted<Dog>(nullptr) == NonCounted<Dog>());
}

TEST(Counted, NotificationsAreCounted) {
    const long live = Countable::GetLiveObjectCount();
    {
        Counted<Notification> n = MakeCounted<InvalidateReflectedsNotification>();
        EXPECT_EQ(n->Describe(), "InvalidateReflecteds");
        EXPECT_EQ(Countable::GetLiveObjectCount(), live + 1);
    }
    EXPECT_EQ(Countable::GetLiveObjectCount(), live);
}

TEST(Counted, CopiesFromManyThreads) {
    const long live = Countable::GetLiveObjectCount();
    const int destroyed = g_Destroyed.load();
    {
        const Counted<Animal> shared = MakeCounted<Dog>();
        constexpr int kThreads = 8;
        constexpr int kCopies = 20000;
        std::atomic<bool> go{false};
        std::vector<std::thread> threads;
        for (int t = 0; t < kThreads; ++t)
            threads.emplace_back([&] {
                while (!go.load())
                    std::this_thread::yield();
                std::vector<Counted<Animal>> held;
                held.reserve(64);
                for (int i = 0; i < kCopies; ++i) {
                    held.push_back(shared);
                    if (held.size() == 64) held.clear();
                    Counted<Dog> dog = CountedCast<Dog>(shared);
                    if (!dog) std::abort();
                }
            });
        go.store(true);
        for (auto& thread : threads)
            thread.join();
        EXPECT_EQ(shared->GetReferenceCount(), 1);
        EXPECT_EQ(g_Destroyed.load(), destroyed);
    }
    EXPECT_EQ(g_Destroyed.load(), destroyed + 1);
    EXPECT_EQ(Countable::GetLiveObjectCount(), live);
}
