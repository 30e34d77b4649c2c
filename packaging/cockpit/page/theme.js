// Follows the style that was chosen in Cockpit's menu, or the browser's.

const dark = matchMedia("(prefers-color-scheme: dark)");

function apply() {
    const chosen = localStorage.getItem("shell:style") || "auto";
    const isDark = chosen === "dark" || (chosen === "auto" && dark.matches);
    document.documentElement.classList.toggle("dark", isDark);
}

export function followTheme() {
    dark.addEventListener("change", apply);
    window.addEventListener("storage", apply);
    window.addEventListener("cockpit-style", apply);
    apply();
}
