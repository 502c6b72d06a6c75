// A program outside the project, built against an installed Torvale.
#include <cstdio>
#include <torvale/torvale.h>

int main() {
    // A null record is refused without touching the database.
    if (DownloadConfGet(nullptr) != -1)
        return 1;
    std::puts("consumer linked");
    return 0;
}
