#include <cstdio>

int main(int, char**) {
    std::puts("vaultora");
    return 0;
}
