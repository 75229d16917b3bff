/// The tests show a machine another time of day with a preloaded library, which then comes before the sanitizers' own.
extern "C" __attribute__((visibility("default"))) const char *__asan_default_options()
{
    return "verify_asan_link_order=0";
}
