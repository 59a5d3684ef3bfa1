// Signing in and out, where the server asks for it. The provider's page takes the place of this one; where one was stays in
// the window meanwhile, for what stands behind "#" is nobody else's business.

const place = 'place';
const left = 'left';
const pause = 10000; // [ms] within which nobody is sent away again who came back as nobody

/** Whether the page is on its way to the provider. */
export function leaveToSignIn(address) {
  const now = Date.now();
  if (!address || now - Number(sessionStorage.getItem(left) ?? 0) < pause) return false;
  sessionStorage.setItem(left, String(now));
  sessionStorage.setItem(place, location.hash);
  location.replace(`${address}?to=/`);
  return true;
}

export function returnToPlace() {
  const hash = sessionStorage.getItem(place);
  sessionStorage.removeItem(place);
  if (hash && !location.hash) history.replaceState(null, '', hash);
}

export async function signOut() {
  const response = await fetch('signout', { method: 'POST', credentials: 'same-origin' });
  if (response.ok) location.replace((await response.json()).to);
}
